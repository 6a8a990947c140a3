#pragma once

// An LDAP server that gives the replies of a test, for behaviour that a real one on this machine does not show. It
// accepts every bind and answers each search with what the function returns.

#include <atomic>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <lber.h>
#include <ldap.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {

class ScriptedServer {
  public:
    struct Search {
        std::string base;
        std::vector<std::string> attributes;
    };
    struct Entry {
        std::string dn;
        std::map<std::string, std::vector<std::string>> attributes;
    };
    struct Reply {
        std::vector<Entry> entries;
        int code = LDAP_SUCCESS;
        std::optional<std::string> cookie = std::nullopt;  ///< of the next page
    };

    explicit ScriptedServer(std::function<Reply(const Search&)> reply) : _reply(std::move(reply)) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        _listening = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (::bind(_listening, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
            ::listen(_listening, 10) != 0 ||
            ::getsockname(_listening, reinterpret_cast<sockaddr*>(&address), &length) != 0) {
            std::abort();
        }
        _port = ntohs(address.sin_port);
        _thread = std::thread([this] { serve(); });
    }
    ScriptedServer(const ScriptedServer&) = delete;
    ScriptedServer& operator=(const ScriptedServer&) = delete;
    ~ScriptedServer() {
        _ended = true;
        _thread.join();
        ::close(_listening);
    }

    [[nodiscard]] std::string uri() const { return "ldap://127.0.0.1:" + std::to_string(_port); }

  private:
    [[nodiscard]] bool isReady(int socket) const {
        pollfd entry{socket, POLLIN, 0};
        while (!_ended) {
            if (::poll(&entry, 1, 20) > 0) {
                return true;
            }
        }
        return false;
    }

    void serve() {
        while (isReady(_listening)) {
            const int client = ::accept(_listening, nullptr, nullptr);
            Sockbuf* buffer = ::ber_sockbuf_alloc();
            int descriptor = client;
            ::ber_sockbuf_add_io(buffer, &ber_sockbuf_io_tcp, LBER_SBIOD_LEVEL_PROVIDER, &descriptor);
            while (isReady(client) && serveOne(buffer)) {
            }
            ::ber_sockbuf_free(buffer);  // also closes the socket
        }
    }

    /// Returns false at the end of the connection.
    bool serveOne(Sockbuf* buffer) {
        BerElement* request = ::ber_alloc_t(LBER_USE_DER);
        ber_len_t length = 0;
        ber_int_t id = 0;
        bool goesOn = ::ber_get_next(buffer, &length, request) == LDAP_TAG_MESSAGE &&
                      ::ber_scanf(request, "i", &id) != LBER_ERROR;
        const ber_tag_t operation = goesOn ? ::ber_peek_tag(request, &length) : LBER_ERROR;
        if (operation == LDAP_REQ_BIND) {
            send(buffer, [&](BerElement* ber) { ::ber_printf(ber, "{it{ess}}", id, LDAP_RES_BIND, 0, "", ""); });
        } else if (operation == LDAP_REQ_SEARCH) {
            const Reply reply = _reply(searchIn(request));
            for (const Entry& entry : reply.entries) {
                sendEntry(buffer, id, entry);
            }
            send(buffer, [&](BerElement* ber) {
                ::ber_printf(ber, "{it{essN}", id, LDAP_RES_SEARCH_RESULT, reply.code, "", "");
                if (reply.cookie) {
                    const std::string page = pageOf(*reply.cookie);
                    ::ber_printf(ber, "t{{so}N}", LDAP_TAG_CONTROLS, LDAP_CONTROL_PAGEDRESULTS, page.data(),
                                 page.size());
                }
                ::ber_printf(ber, "N}");
            });
        } else if (operation != LDAP_REQ_ABANDON) {
            goesOn = false;
        }
        ::ber_free(request, 1);
        return goesOn;
    }

    /// The value of the control for pages, without an estimate of the number of entries.
    static std::string pageOf(const std::string& cookie) {
        BerElement* ber = ::ber_alloc_t(LBER_USE_DER);
        berval value{};
        ::ber_printf(ber, "{io}", 0, cookie.data(), cookie.size());
        ::ber_flatten2(ber, &value, 0);
        std::string text(value.bv_val, value.bv_len);
        ::ber_free(ber, 1);
        return text;
    }

    static Search searchIn(BerElement* request) {
        Search search;
        berval base{};
        ber_int_t ignored = 0;
        ber_len_t length = 0;
        ::ber_scanf(request, "{meeiib", &base, &ignored, &ignored, &ignored, &ignored, &ignored);
        search.base.assign(base.bv_val, base.bv_len);
        berval filter{};
        ::ber_peek_tag(request, &length);
        ::ber_skip_element(request, &filter);
        char* last = nullptr;
        for (ber_tag_t tag = ::ber_first_element(request, &length, &last); tag != LBER_DEFAULT;
             tag = ::ber_next_element(request, &length, last)) {
            berval attribute{};
            if (::ber_scanf(request, "m", &attribute) == LBER_ERROR) {
                break;
            }
            search.attributes.emplace_back(attribute.bv_val, attribute.bv_len);
        }
        return search;
    }

    static void sendEntry(Sockbuf* buffer, ber_int_t id, const Entry& entry) {
        send(buffer, [&](BerElement* ber) {
            ::ber_printf(ber, "{it{s{", id, LDAP_RES_SEARCH_ENTRY, entry.dn.c_str());
            for (const auto& [name, values] : entry.attributes) {
                ::ber_printf(ber, "{s[", name.c_str());
                for (const std::string& value : values) {
                    ::ber_printf(ber, "s", value.c_str());
                }
                ::ber_printf(ber, "]N}");
            }
            ::ber_printf(ber, "N}N}N}");
        });
    }

    template <class Write>
    static void send(Sockbuf* buffer, Write write) {
        BerElement* ber = ::ber_alloc_t(LBER_USE_DER);
        write(ber);
        ::ber_flush2(buffer, ber, LBER_FLUSH_FREE_ALWAYS);
    }

    std::function<Reply(const Search&)> _reply;
    std::atomic<bool> _ended = false;
    int _listening = -1;
    int _port = 0;
    std::thread _thread;
};

}  // namespace adminhost
