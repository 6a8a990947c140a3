#include "platform/directory/LdapWaitLimit.h"

#include <algorithm>
#include <cerrno>
#include <limits>

#include <poll.h>

namespace adminhost {
namespace {

using Clock = LdapWaitLimit::Clock;

/// Waits until the socket is ready. Returns false, with errno set, at the end of the time.
bool waitFor(Sockbuf_IO_Desc* layer, short events) noexcept {
    const auto* limit = static_cast<const LdapWaitLimit*>(layer->sbiod_pvt);
    int socket = -1;
    if (::ber_sockbuf_ctrl(layer->sbiod_sb, LBER_SB_OPT_GET_FD, &socket) != 1) {
        errno = EBADF;
        return false;
    }
    pollfd ready{socket, events, 0};
    while (true) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(limit->end() - Clock::now()).count();
        const auto wait = std::clamp<std::int64_t>(left, 0, std::numeric_limits<int>::max());
        const int count = ::poll(&ready, 1, static_cast<int>(wait));
        if (count > 0) {
            return true;
        }
        if (count == 0) {
            // Not EAGAIN, after which the TLS library would try for ever.
            errno = ETIMEDOUT;
            return false;
        }
        if (errno != EINTR) {
            return false;
        }
    }
}

int setUp(Sockbuf_IO_Desc* layer, void* limit) noexcept {
    layer->sbiod_pvt = limit;
    return 0;
}

int tearDown(Sockbuf_IO_Desc* /*layer*/) noexcept {
    return 0;
}

int control(Sockbuf_IO_Desc* layer, int option, void* argument) noexcept {
    return LBER_SBIOD_CTRL_NEXT(layer, option, argument);
}

ber_slen_t readSome(Sockbuf_IO_Desc* layer, void* buffer, ber_len_t size) noexcept {
    // A server that sends a byte now and then must not go on for ever.
    if (static_cast<const LdapWaitLimit*>(layer->sbiod_pvt)->end() <= Clock::now()) {
        errno = ETIMEDOUT;
        return -1;
    }
    return waitFor(layer, POLLIN) ? LBER_SBIOD_READ_NEXT(layer, buffer, size) : -1;
}

ber_slen_t writeSome(Sockbuf_IO_Desc* layer, void* buffer, ber_len_t size) noexcept {
    return waitFor(layer, POLLOUT) ? LBER_SBIOD_WRITE_NEXT(layer, buffer, size) : -1;
}

Sockbuf_IO boundedLayer{&setUp, &tearDown, &control, &readSome, &writeSome, &tearDown};

/// Called by the library when a socket is connected, before TLS begins.
int addLayer(LDAP* /*handle*/, Sockbuf* socket, LDAPURLDesc* /*server*/, sockaddr* /*address*/,
             ldap_conncb* callback) noexcept {
    // Between the socket itself and TLS.
    constexpr int level = (LBER_SBIOD_LEVEL_PROVIDER + LBER_SBIOD_LEVEL_TRANSPORT) / 2;
    return ::ber_sockbuf_add_io(socket, &boundedLayer, level, callback->lc_arg) == 0 ? LDAP_SUCCESS : LDAP_LOCAL_ERROR;
}

void doNothing(LDAP* /*handle*/, Sockbuf* /*socket*/, ldap_conncb* /*callback*/) noexcept {}

}  // namespace

void LdapWaitLimit::applyTo(LDAP* handle) noexcept {
    _whenConnected.lc_add = &addLayer;
    _whenConnected.lc_del = &doNothing;
    _whenConnected.lc_arg = this;
    ::ldap_set_option(handle, LDAP_OPT_CONNECT_CB, &_whenConnected);
}

}  // namespace adminhost
