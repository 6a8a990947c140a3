#include "adminhostctl/Follow.h"

#include "adminhostctl/Width.h"

#include <chrono>
#include <thread>

namespace adminhost::ctl {
namespace {

constexpr auto pollPause = std::chrono::milliseconds(500);
constexpr auto retryPause = std::chrono::seconds(1);
constexpr int retries = 30;

}  // namespace

void followUntilClosed(const Context& context, const std::function<bool()>& printNew) {
    int failures = 0;
    while (context.out) {
        bool more = false;
        try {
            more = printNew();
            failures = 0;
        } catch (const Unavailable& failure) {
            if (++failures == retries) {
                throw;
            }
            if (failures == 1) {
                context.err << "adminhostctl: " << shown(failure.what()) << "; trying again\n";
            }
            std::this_thread::sleep_for(retryPause);
        }
        context.out.flush();
        if (!more) {
            std::this_thread::sleep_for(pollPause);
        }
    }
}

}  // namespace adminhost::ctl
