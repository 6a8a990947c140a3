// krb5-list cache TYPE NAME | keytab TYPE NAME: prints a credential cache or a keytab, through the object layer alone,
// in the form of klist(1) in the C locale, so that the two can be compared. Exit status 1 with a message on failure.

#include "krb5/KRB5CredentialCache.h"
#include "krb5/KRB5Keytab.h"
#include "platform/value/ValueText.h"

#include <ctime>
#include <iomanip>
#include <iostream>
#include <sstream>
#include <string>
#include <string_view>

namespace lumio {
namespace {

std::string timeText(adminhost::Date date) {
    const std::time_t seconds = std::chrono::system_clock::to_time_t(date);
    std::tm local{};
    localtime_r(&seconds, &local);
    std::ostringstream text;
    text << std::put_time(&local, "%m/%d/%y %H:%M:%S");
    return text.str();
}

std::string textOf(const std::unique_ptr<KRB5Principal>& principal) {
    return adminhost::textOf(principal ? principal->stringValue() : std::nullopt);
}

/// The short name, as klist prints it; enctypeString() is the long one.
std::string enctypeName(const KRB5KeytabEntry& entry) {
    char name[100];
    const auto enctype = static_cast<krb5_enctype>(entry.enctype());
    return krb5_enctype_to_name(enctype, 0, name, sizeof name) == 0 ? name : entry.enctypeString();
}

bool listCache(const std::string& type, const std::string& name) {
    const auto cache = KRB5CredentialCache::initWithName(name, type, nullptr, KRB5Context::context());
    if (!cache) {
        std::cerr << "cannot open cache " << type << ":" << name << "\n";
        return false;
    }
    const auto principal = cache->principal();
    if (!principal) {
        std::cerr << cache->errorMessage() << "\n";
        return false;
    }
    std::cout << "Ticket cache: " << adminhost::textOf(cache->type()) << ":" << adminhost::textOf(cache->name())
              << "\nDefault principal: " << textOf(principal)
              << "\n\nValid starting     Expires            Service principal\n";
    for (const KRB5Credential& credential : cache->credentials()) {
        const auto server = credential.serverPrincipal();
        if (server && server->realm() == "X-CACHECONF:") {
            continue;  // the library's own notes, which klist leaves out too
        }
        std::cout << timeText(*credential.startTime()) << "  " << timeText(*credential.endTime()) << "  "
                  << textOf(server) << "\n";
        if (*credential.renewUntil() != adminhost::Date()) {
            std::cout << "\trenew until " << timeText(*credential.renewUntil()) << "\n";
        }
    }
    if (cache->errorCode() != 0) {
        std::cerr << cache->errorMessage() << "\n";
    }
    return cache->errorCode() == 0;
}

bool listKeytab(const std::string& type, const std::string& name) {
    const auto keytab = KRB5Keytab::initWithName(name, type, KRB5Context::context());
    if (!keytab || keytab->nativeKeytab() == nullptr) {
        std::cerr << "cannot open keytab " << type << ":" << name << "\n";
        return false;
    }
    std::cout << "Keytab name: " << keytab->description() << "\nKVNO Timestamp         Principal\n"
              << "---- ----------------- --------------------------------------------------------\n";
    for (const KRB5KeytabEntry& entry : keytab->entries()) {
        const std::string vno = std::to_string(entry.vno());
        std::cout << std::string(vno.size() < 4 ? 4 - vno.size() : 0, ' ') << vno << " " << timeText(entry.timestamp())
                  << " " << textOf(entry.principal()) << " (" << enctypeName(entry) << ") \n";
    }
    if (keytab->errorCode() != KRB5_KT_END) {
        std::cerr << keytab->errorMessage() << "\n";
    }
    return keytab->errorCode() == KRB5_KT_END;
}

}  // namespace
}  // namespace lumio

int main(int argc, char** argv) {
    const std::string_view what = argc == 4 ? argv[1] : "";
    if (what == "cache") {
        return lumio::listCache(argv[2], argv[3]) ? 0 : 1;
    }
    if (what == "keytab") {
        return lumio::listKeytab(argv[2], argv[3]) ? 0 : 1;
    }
    std::cerr << "usage: krb5-list cache|keytab TYPE NAME\n";
    return 2;
}
