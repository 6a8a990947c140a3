#include "adminhostd/DirectoryConfiguration.h"

#include "platform/text/FilterSyntax.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <stdexcept>

#include <fmt/format.h>

namespace adminhost {
namespace {

using Entry = ConfigurationEntry;
using Settings = LdapNodeSettings;

constexpr std::string_view reservedName = "/Search";

HostPath path(const Entry& entry) {
    std::string text = entry.name();
    if (!text.starts_with('/')) {
        entry.fail("an absolute path");
    }
    return HostPath(std::move(text));
}

std::vector<std::string> uris(const Entry& entry) {
    std::vector<std::string> list = entry.texts();
    const bool fits = std::all_of(list.begin(), list.end(), [](const std::string& uri) {
        return uri.starts_with("ldap://") || uri.starts_with("ldaps://") || uri.starts_with("ldapi://");
    });
    if (list.empty() || !fits) {
        entry.fail("a list of texts that begin with ldap://, ldaps:// or ldapi://");
    }
    return list;
}

/// The outer parentheses may be left out.
std::string filter(const Entry& entry) {
    std::string text = entry.name();
    const bool enclosed = text.starts_with('(');
    if (const auto problem = ldapFilterProblem(enclosed ? text : "(" + text + ")")) {
        entry.reject(fmt::format("is not a filter: at its byte {} there must be {}",
                                 problem->offset + (enclosed ? 1 : 0), problem->expected));
    }
    return text;
}

std::string credential(const Entry& entry) {
    std::string text = entry.name();
    if (text == "." || text == ".." || text.find('/') != std::string::npos) {
        entry.fail("the name of a credential, without a directory");
    }
    return text;
}

std::string attribute(const Entry& entry) {
    std::string text = entry.text();
    if (!isLdapAttribute(text)) {
        entry.fail("the name of an LDAP attribute");
    }
    return text;
}

constexpr std::string_view mappedKeys[] = {"RecordName",       "RealName",        "GeneratedUID",
                                           "UniqueID",         "PrimaryGroupID",  "NFSHomeDirectory",
                                           "UserShell",        "GroupMembership", "AuthenticationAuthority",
                                           "KerberosPrincipal"};

std::map<std::string, std::string> mapping(const Entry& entry, std::string_view tables) {
    std::map<std::string, std::string> map;
    entry.forEach(tables, [&](const Entry& mapped) {
        if (std::find(std::begin(mappedKeys), std::end(mappedKeys), mapped.key()) == std::end(mappedKeys)) {
            mapped.rejectAsUnknown(mappedKeys);
        }
        map.emplace(mapped.key(), attribute(mapped));
    });
    return map;
}

void applyMaps(const Entry& entry, Settings& settings) {
    constexpr std::string_view known[] = {"users", "groups"};
    entry.forEach("directory.node.map.", [&](const Entry& map) {
        if (map.key() == "users") {
            settings.userMap = mapping(map, "directory.node.map.users.");
        } else if (map.key() == "groups") {
            settings.groupMap = mapping(map, "directory.node.map.groups.");
        } else {
            map.rejectAsUnknown(known);
        }
    });
}

std::map<std::string, std::vector<std::string>> createdAttributes(const Entry& entry) {
    std::map<std::string, std::vector<std::string>> attributes;
    entry.forEach("directory.node.create_attributes.", [&](const Entry& created) {
        if (!isLdapAttribute(created.key())) {
            created.reject("is not the name of an LDAP attribute");
        }
        attributes.emplace(created.key(), created.node().is_array() ? created.texts() : std::vector{created.text()});
    });
    return attributes;
}

std::vector<std::string> objectClasses(const Entry& entry) {
    std::vector<std::string> classes = entry.texts();
    if (classes.empty() || !std::all_of(classes.begin(), classes.end(), isLdapAttribute)) {
        entry.fail("a list of names of object classes");
    }
    return classes;
}

struct Key {
    std::string_view name;
    void (*apply)(const Entry& entry, Settings& settings);
};

constexpr Key keys[] = {
    {"name", [](const Entry& e, Settings& s) { s.name = e.name(); }},
    {"kind", [](const Entry&, Settings&) {}},  // read before the others
    {"uri", [](const Entry& e, Settings& s) { s.uris = uris(e); }},
    {"base", [](const Entry& e, Settings& s) { s.base = e.name(); }},
    {"user_base", [](const Entry& e, Settings& s) { s.userBase = e.name(); }},
    {"group_base", [](const Entry& e, Settings& s) { s.groupBase = e.name(); }},
    {"user_filter", [](const Entry& e, Settings& s) { s.userFilter = filter(e); }},
    {"group_filter", [](const Entry& e, Settings& s) { s.groupFilter = filter(e); }},
    {"bind_dn", [](const Entry& e, Settings& s) { s.bindDn = e.name(); }},
    {"bind_password_file", [](const Entry& e, Settings& s) { s.bindPasswordFile = path(e); }},
    {"bind_password_credential", [](const Entry& e, Settings& s) { s.bindPasswordCredential = credential(e); }},
    {"sasl", [](const Entry& e, Settings& s) { s.sasl = e.choice<Settings::Sasl>(saslWords); }},
    {"cert_file", [](const Entry& e, Settings& s) { s.certFile = path(e); }},
    {"key_file", [](const Entry& e, Settings& s) { s.keyFile = path(e); }},
    {"keytab", [](const Entry& e, Settings& s) { s.keytab = path(e); }},
    {"principal", [](const Entry& e, Settings& s) { s.principal = e.name(); }},
    {"starttls", [](const Entry& e, Settings& s) { s.startTls = e.boolean(); }},
    {"ca_file", [](const Entry& e, Settings& s) { s.caFile = path(e); }},
    {"verify", [](const Entry& e, Settings& s) { s.verify = e.choice<Settings::Verify>(verifyWords); }},
    {"schema", [](const Entry& e, Settings& s) { s.schema = e.choice<Settings::Schema>(schemaWords); }},
    {"uuid_form", [](const Entry& e, Settings& s) { s.uuidForm = e.choice<Settings::UuidForm>(uuidFormWords); }},
    {"kerberos_realm", [](const Entry& e, Settings& s) { s.kerberosRealm = e.name(); }},
    {"map", &applyMaps},
    {"timeout_seconds",
     [](const Entry& e, Settings& s) { s.timeout = std::chrono::seconds(std::llround(std::ceil(e.seconds()))); }},
    {"create_base", [](const Entry& e, Settings& s) { s.createBase = e.name(); }},
    {"object_classes", [](const Entry& e, Settings& s) { s.objectClasses = objectClasses(e); }},
    {"create_attributes", [](const Entry& e, Settings& s) { s.createAttributes = createdAttributes(e); }},
};

constexpr std::string_view localKeys[] = {"name", "kind", "kerberos_realm"};

std::vector<std::string_view> namesOfKeys() {
    std::vector<std::string_view> names;
    std::transform(std::begin(keys), std::end(keys), std::back_inserter(names),
                   [](const Key& key) { return key.name; });
    return names;
}

/// Reads one node: each key by itself, then what they mean together.
class NodeReader {
  public:
    NodeReader(const std::string& file, const toml::node& node) : _file(file), _node(node) {}

    DirectoryNodeOptions read() {
        const toml::table* table = _node.as_table();
        if (table == nullptr) {
            throw std::runtime_error(fmt::format("{}: \"directory.node\" must be a list of tables: [[directory.node]]",
                                                 placeText(_file, _node.source().begin)));
        }
        _options.places[""] = placeText(_file, _node.source().begin);
        if (const toml::node* kind = table->get("kind")) {
            _options.local = Entry(_file, tables, table->find("kind")->first, *kind)
                                 .choice<bool>({{"ldap", false}, {"local", true}});
        }
        for (const auto& [key, node] : *table) {
            apply(Entry(_file, tables, key, node));
            _options.places.emplace(key.str(), placeText(_file, node.source().begin));
        }
        require("name", !_options.settings.name.empty());
        if (!_options.local) {
            checkTogether();
        }
        return std::move(_options);
    }

  private:
    static constexpr std::string_view tables = "directory.node.";

    void apply(const Entry& entry) {
        const auto found =
            std::find_if(std::begin(keys), std::end(keys), [&](const Key& key) { return key.name == entry.key(); });
        if (found == std::end(keys)) {
            entry.rejectAsUnknown(namesOfKeys());
        }
        if (_options.local &&
            std::find(std::begin(localKeys), std::end(localKeys), entry.key()) == std::end(localKeys)) {
            entry.reject("is not for a node of the kind \"local\"");
        }
        found->apply(entry, _options.settings);
    }

    [[nodiscard]] bool has(std::string_view key) const { return _options.places.contains(std::string(key)); }
    [[noreturn]] void reject(std::string_view key, std::string_view problem) const {
        const auto place = _options.places.find(std::string(key));
        throw std::runtime_error(
            fmt::format("{}: \"{}{}\" {}", (place == _options.places.end() ? _options.places.find("") : place)->second,
                        tables, key, problem));
    }
    void require(std::string_view key, bool present) const {
        if (!present) {
            reject(key, "is missing");
        }
    }
    void requireWith(std::string_view key, std::string_view other) const {
        if (has(key) && !has(other)) {
            reject(key, fmt::format("needs \"{}\"", other));
        }
    }
    void exclude(std::string_view key, std::string_view other) const {
        if (has(key) && has(other)) {
            reject(key, fmt::format("excludes \"{}\"", other));
        }
    }

    void checkTogether() const {
        const Settings& settings = _options.settings;
        require("uri", has("uri"));
        require("base", has("base") || (has("user_base") && has("group_base")));
        exclude("bind_password_file", "bind_password_credential");
        requireWith("bind_password_file", "bind_dn");
        requireWith("bind_password_credential", "bind_dn");
        if (has("bind_dn") && !has("bind_password_file") && !has("bind_password_credential")) {
            reject("bind_dn", "needs \"bind_password_file\" or \"bind_password_credential\"");
        }
        if (settings.sasl != Settings::Sasl::none) {
            exclude("bind_dn", "sasl");
        }
        if (settings.sasl != Settings::Sasl::gssapi) {
            for (const char* key : {"keytab", "principal"}) {
                if (has(key)) {
                    reject(key, "needs sasl = \"gssapi\"");
                }
            }
        } else if (!has("keytab")) {
            reject("sasl", "needs \"keytab\" if it is \"gssapi\"");
        }
        requireWith("cert_file", "key_file");
        requireWith("key_file", "cert_file");
        if (settings.startTls && std::any_of(settings.uris.begin(), settings.uris.end(),
                                             [](const std::string& uri) { return !uri.starts_with("ldap://"); })) {
            reject("starttls", "is only for URIs that begin with ldap://");
        }
    }

    const std::string& _file;
    const toml::node& _node;
    DirectoryNodeOptions _options;
};

/// Rejects names that are reserved or used before, and a second node of the local accounts.
void checkAmong(const std::vector<DirectoryNodeOptions>& before, const DirectoryNodeOptions& node) {
    const auto place = [&](const char* key) {
        return node.places.contains(key) ? node.places.at(key) : node.places.at("");
    };
    const std::string& name = node.settings.name;
    if (name == reservedName) {
        throw std::runtime_error(
            fmt::format("{}: \"directory.node.name\" must not be \"{}\", the name of the search in "
                        "all nodes",
                        place("name"), reservedName));
    }
    for (const DirectoryNodeOptions& other : before) {
        if (other.settings.name == name) {
            throw std::runtime_error(
                fmt::format("{}: \"directory.node.name\" must be another: \"{}\" is the name of the node at {}",
                            place("name"), name, other.places.at("")));
        }
        if (other.local && node.local) {
            throw std::runtime_error(
                fmt::format("{}: \"directory.node.kind\" must not be \"local\" twice: the node at {} is one",
                            place("kind"), other.places.at("")));
        }
    }
}

}  // namespace

void readDirectory(const ConfigurationEntry& directory, DirectoryOptions& options) {
    constexpr std::string_view known[] = {"node", "budget_seconds"};
    directory.forEach("directory.", [&](const ConfigurationEntry& entry) {
        if (entry.key() == "budget_seconds") {
            options.budget = std::chrono::milliseconds(std::llround(std::ceil(entry.seconds() * 1000)));
        } else if (entry.key() == "node") {
            const toml::array* nodes = entry.node().as_array();
            if (nodes == nullptr) {
                entry.fail("a list of tables: [[directory.node]]");
            }
            for (const toml::node& node : *nodes) {
                DirectoryNodeOptions read = NodeReader(entry.file(), node).read();
                checkAmong(options.nodes, read);
                options.nodes.push_back(std::move(read));
            }
        } else {
            entry.rejectAsUnknown(known);
        }
    });
}

}  // namespace adminhost
