#include "platform/service/Managers.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <memory>
#include <string_view>
#include <system_error>

#include <systemd/sd-bus.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::microseconds;

constexpr auto bound = std::chrono::seconds(2);
constexpr const char* destination = "org.freedesktop.systemd1";

// A bus that is closed without flushing: nothing that is still to be sent matters, and flushing could wait for ever.
using Bus = std::unique_ptr<sd_bus, decltype(&sd_bus_close_unref)>;
using Message = std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)>;

/// Microseconds until the deadline; at least 1, because 0 means the library's own bound.
std::uint64_t left(Clock::time_point deadline) {
    const auto time = std::chrono::duration_cast<microseconds>(deadline - Clock::now()).count();
    return static_cast<std::uint64_t>(std::max<microseconds::rep>(time, 1));
}

Error systemError(std::string_view step, int number) {
    return {"systemd", number, std::string(step) + ": " + std::generic_category().message(number)};
}

/// A connection to the system bus that has been greeted. The library itself would wait for a silent bus for minutes.
Result<Bus> connect(Clock::time_point deadline) {
    sd_bus* opened = nullptr;
    int status = ::sd_bus_open_system(&opened);
    Bus bus(opened, &sd_bus_close_unref);
    while (status >= 0 && (status = ::sd_bus_is_ready(bus.get())) == 0) {
        if (Clock::now() >= deadline) {
            return failure(systemError("cannot connect to the system bus", ETIMEDOUT));
        }
        status = ::sd_bus_process(bus.get(), nullptr);
        if (status == 0) {
            status = ::sd_bus_wait(bus.get(), left(deadline));
        }
    }
    if (status < 0) {
        return failure(systemError("cannot connect to the system bus", -status));
    }
    return bus;
}

/// The reply to a method call of the service manager with text arguments.
template <class... Texts>
Result<Message> call(sd_bus* bus, Clock::time_point deadline, const char* path, const char* interface,
                     const char* method, Texts... arguments) {
    sd_bus_message* made = nullptr;
    int status = ::sd_bus_message_new_method_call(bus, &made, destination, path, interface, method);
    const Message request(made, &sd_bus_message_unref);
    for (const char* argument : {arguments...}) {
        status = status < 0 ? status : ::sd_bus_message_append_basic(request.get(), SD_BUS_TYPE_STRING, argument);
    }
    sd_bus_error error{};
    sd_bus_message* received = nullptr;
    if (status >= 0) {
        status = ::sd_bus_call(bus, request.get(), left(deadline), &error, &received);
    }
    Message reply(received, &sd_bus_message_unref);
    const std::unique_ptr<sd_bus_error, decltype(&sd_bus_error_free)> freed(&error, &sd_bus_error_free);
    if (status < 0) {
        return failure(error.message != nullptr ? Error{"systemd", -status, std::string(method) + ": " + error.message}
                                                : systemError(method, -status));
    }
    return reply;
}

}  // namespace

Result<bool> unitIsRunning(const std::string& unit) {
    const auto deadline = Clock::now() + bound;
    const auto bus = connect(deadline);
    if (!bus) {
        return failure(bus.error());
    }
    // Other than GetUnit, this also gives the object of a unit that is stopped or does not exist.
    const auto loaded = call(bus->get(), deadline, "/org/freedesktop/systemd1", "org.freedesktop.systemd1.Manager",
                             "LoadUnit", unit.c_str());
    if (!loaded) {
        return failure(loaded.error());
    }
    const char* path = nullptr;
    if (const int status = ::sd_bus_message_read_basic(loaded->get(), SD_BUS_TYPE_OBJECT_PATH, &path); status <= 0) {
        return failure(systemError("LoadUnit", status < 0 ? -status : ENODATA));
    }
    const auto property = call(bus->get(), deadline, path, "org.freedesktop.DBus.Properties", "Get",
                               "org.freedesktop.systemd1.Unit", "ActiveState");
    if (!property) {
        return failure(property.error());
    }
    const char* text = nullptr;
    if (const int status = ::sd_bus_message_read(property->get(), "v", "s", &text); status <= 0) {
        return failure(systemError("ActiveState", status < 0 ? -status : ENODATA));
    }
    const std::string_view state(text);
    return state == "active" || state == "reloading" || state == "deactivating";
}

}  // namespace adminhost
