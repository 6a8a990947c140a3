#pragma once

// The event loop in which a thread waits for name resolution.
//
// A loop and the services resolved in it are made and freed inside one operation; all callbacks arrive on the thread
// that runs the loop, and only while it runs (or starts) something. Services must be gone before their loop.

#include <chrono>
#include <memory>
#include <vector>

namespace adminhost {

class NetService;

class EventLoop {
  public:
    EventLoop();
    EventLoop(const EventLoop&) = delete;
    EventLoop& operator=(const EventLoop&) = delete;
    ~EventLoop();

    /// Waits until a resolver has news (an address, a failure, its time-out), delivers it and answers true; answers
    /// false when the time is over first. Traffic with the daemons that is no news does not end the wait.
    bool runOnce(std::chrono::milliseconds time);

  private:
    friend class NetService;
    struct Poll;
    std::unique_ptr<Poll> _poll;
    std::vector<NetService*> _services;  ///< with a resolution under way
};

}  // namespace adminhost
