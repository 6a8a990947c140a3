#include "platform/dnssd/AvahiDaemon.h"

#include "platform/text/Utf8.h"

#include <cstdint>
#include <cstring>
#include <memory>

#include <avahi-common/defs.h>
#include <systemd/sd-bus.h>

namespace adminhost {
namespace {

struct FreeBusObject {
    void operator()(sd_bus* bus) const noexcept { ::sd_bus_close_unref(bus); }
    void operator()(sd_bus_message* message) const noexcept { ::sd_bus_message_unref(message); }
};

class BusError {
  public:
    BusError() = default;
    BusError(const BusError&) = delete;
    BusError& operator=(const BusError&) = delete;
    ~BusError() { ::sd_bus_error_free(&_error); }

    [[nodiscard]] sd_bus_error* get() noexcept { return &_error; }
    [[nodiscard]] std::string text(int status) const {
        return utf8Of(_error.message != nullptr ? _error.message : std::strerror(-status));
    }

  private:
    sd_bus_error _error{};
};

}  // namespace

std::optional<std::string> avahiProblem(std::chrono::milliseconds limit) {
    sd_bus* opened = nullptr;
    if (const int status = ::sd_bus_open_system(&opened); status < 0) {
        return std::string("the system bus cannot be reached (") + std::strerror(-status) + ")";
    }
    const std::unique_ptr<sd_bus, FreeBusObject> bus(opened);
    sd_bus_message* created = nullptr;
    int status = ::sd_bus_message_new_method_call(bus.get(), &created, "org.freedesktop.Avahi", "/",
                                                  "org.freedesktop.Avahi.Server", "GetState");
    const std::unique_ptr<sd_bus_message, FreeBusObject> call(created);
    BusError error;
    sd_bus_message* received = nullptr;
    if (status >= 0) {
        status = ::sd_bus_message_set_auto_start(call.get(), 0);
    }
    if (status >= 0) {
        const auto microseconds = std::chrono::microseconds(limit).count();
        status = ::sd_bus_call(bus.get(), call.get(), static_cast<std::uint64_t>(microseconds), error.get(), &received);
    }
    const std::unique_ptr<sd_bus_message, FreeBusObject> reply(received);
    std::int32_t state = AVAHI_SERVER_INVALID;
    if (status >= 0) {
        status = ::sd_bus_message_read(reply.get(), "i", &state);
    }
    if (status < 0) {
        return "the Avahi daemon does not reply (" + error.text(status) + ")";
    }
    switch (state) {
        case AVAHI_SERVER_RUNNING:
        case AVAHI_SERVER_REGISTERING:
            return std::nullopt;
        case AVAHI_SERVER_COLLISION:
            return "the Avahi daemon has found another host with this host's name";
        default:
            return "the Avahi daemon has failed";
    }
}

}  // namespace adminhost
