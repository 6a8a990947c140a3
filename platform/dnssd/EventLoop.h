#pragma once

// The event loop in which a thread waits for name resolution.
//
// A loop and the services resolved in it are created and freed inside one operation. All callbacks arrive on the thread
// that runs the loop, and only while it runs (or starts) something. Services must be destroyed before their loop.

#include "platform/framework/Export.h"

#include <chrono>
#include <memory>
#include <vector>

namespace adminhost {

class NetService;

class ADMINHOST_EXPORT EventLoop {
  public:
    EventLoop();
    EventLoop(const EventLoop&) = delete;
    EventLoop& operator=(const EventLoop&) = delete;
    ~EventLoop();

    /// Waits until a resolver has news (an address, a failure, its time-out), delivers it and returns true. Returns
    /// false if the time is over first. Other traffic with the daemons does not end the wait.
    bool runOnce(std::chrono::milliseconds time);

  private:
    friend class NetService;
    struct Poll;
    std::unique_ptr<Poll> _poll;
    std::vector<NetService*> _services;  ///< with a resolution under way
};

}  // namespace adminhost
