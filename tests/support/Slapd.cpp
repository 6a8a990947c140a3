#include "tests/support/Slapd.h"

#include "tests/support/Program.h"

#include <stdexcept>
#include <utility>

#include <unistd.h>

namespace support {

using adminhost::test::Errors;
using adminhost::test::runProgram;

namespace {

/// The Kerberos principal of an account, and attributes in which tests put UUIDs of other forms. As in a vendor's
/// schema, the principal is compared exactly.
constexpr std::string_view commonSchema = R"(
attributetype ( 2.16.840.1.113719.1.301.4.1.1 NAME 'krbPrincipalName'
  EQUALITY caseExactIA5Match SYNTAX 1.3.6.1.4.1.1466.115.121.1.26 )
objectclass ( 2.16.840.1.113719.1.301.6.8.1 NAME 'krbPrincipalAux' SUP top AUXILIARY MAY krbPrincipalName )
attributetype ( 1.3.6.1.4.1.99999.1.1 NAME 'testUuidBytes'
  EQUALITY octetStringMatch SYNTAX 1.3.6.1.4.1.1466.115.121.1.40 SINGLE-VALUE )
attributetype ( 1.3.6.1.4.1.99999.1.2 NAME 'testUuidText'
  EQUALITY caseExactMatch SYNTAX 1.3.6.1.4.1.1466.115.121.1.15 SINGLE-VALUE )
attributetype ( 1.3.6.1.4.1.99999.1.3 NAME 'testAuthority'
  EQUALITY caseExactMatch SYNTAX 1.3.6.1.4.1.1466.115.121.1.15 )
attributetype ( 1.3.6.1.4.1.99999.1.4 NAME 'testLogin'
  EQUALITY octetStringMatch SYNTAX 1.3.6.1.4.1.1466.115.121.1.40 )
objectclass ( 1.3.6.1.4.1.99999.2.1 NAME 'testIdentified' SUP top AUXILIARY
  MAY ( testUuidBytes $ testUuidText $ testAuthority $ testLogin ) )
)";

/// Accounts and groups as auxiliary classes, so that a group can list members by DN as well.
constexpr std::string_view auxiliaryAccounts = R"(
attributetype ( 1.3.6.1.1.1.1.3 NAME 'homeDirectory'
  EQUALITY caseExactIA5Match SYNTAX 1.3.6.1.4.1.1466.115.121.1.26 SINGLE-VALUE )
attributetype ( 1.3.6.1.1.1.1.4 NAME 'loginShell'
  EQUALITY caseExactIA5Match SYNTAX 1.3.6.1.4.1.1466.115.121.1.26 SINGLE-VALUE )
attributetype ( 1.3.6.1.1.1.1.12 NAME 'memberUid'
  EQUALITY caseExactMatch SYNTAX 1.3.6.1.4.1.1466.115.121.1.15 )
objectclass ( 1.3.6.1.1.1.2.0 NAME 'posixAccount' SUP top AUXILIARY
  MUST ( cn $ uid $ uidNumber $ gidNumber $ homeDirectory ) MAY ( loginShell $ description ) )
objectclass ( 1.3.6.1.1.1.2.2 NAME 'posixGroup' SUP top AUXILIARY
  MUST gidNumber MAY ( memberUid $ description ) )
)";

std::string percentEncoded(std::string_view path) {
    std::string text;
    for (const char c : path) {
        text += c == '/' ? std::string("%2F") : std::string(1, c);
    }
    return text;
}

}  // namespace

Slapd::Slapd(Options options) : _options(std::move(options)), _directory(createTemporaryDirectory("slapd")) {
    try {
        std::filesystem::create_directory(_directory / "db");
        configure();
        for (int attempt = 0; !_server.isRunning(); ++attempt) {
            _port = freePort();
            _securePort = _options.certificates ? freePort() : 0;
            if (!tryToStart() && attempt == 5) {
                throw std::runtime_error("slapd: " + contentsOf(_directory / "slapd.out"));
            }
        }
    } catch (...) {
        _server.stop();
        std::filesystem::remove_all(_directory);
        throw;
    }
}

Slapd::~Slapd() {
    _server.stop();
    std::error_code ignored;
    std::filesystem::remove_all(_directory, ignored);
}

std::string Slapd::localUri() const {
    return "ldapi://" + percentEncoded((_directory / "ldapi").string());
}

void Slapd::configure() const {
    const std::string directory = _directory;
    const bool bis = _options.schema == Schema::rfc2307bis;
    writeFile(_directory / "test.schema", std::string(bis ? auxiliaryAccounts : "").append(commonSchema));
    std::string text;
    for (const char* const schema : {"core", "cosine", bis ? "" : "nis", "inetorgperson"}) {
        if (*schema != '\0') {
            text.append("include /etc/ldap/schema/").append(schema).append(".schema\n");
        }
    }
    text += "include " + directory + "/test.schema\nmodulepath /usr/lib/ldap\nmoduleload back_mdb\npidfile " +
            directory + "/pid\nargsfile " + directory +
            "/args\nsasl-host localhost\nsasl-secprops none\nlocalSSF 128\npassword-hash {SSHA}\n"
            "authz-regexp \"uid=([^,]+),cn=gssapi,cn=auth\" \"uid=$1,ou=people,dc=nimbo,dc=test\"\n"
            "authz-regexp \"uid=([^,]+),cn=[^,]+,cn=gssapi,cn=auth\" \"uid=$1,ou=people,dc=nimbo,dc=test\"\n"
            "authz-regexp \"gidNumber=" +
            std::to_string(::getegid()) + "[+]uidNumber=" + std::to_string(::geteuid()) +
            ",cn=peercred,cn=external,cn=auth\" \"cn=admin,dc=nimbo,dc=test\"\n";
    if (_options.certificates) {
        text += "TLSCACertificateFile " + _options.certificates->authority.string() + "\nTLSCertificateFile " +
                _options.certificates->certificate.string() + "\nTLSCertificateKeyFile " +
                _options.certificates->key.string() + "\n";
    }
    text += _options.global;
    text +=
        "database mdb\nmaxsize 104857600\nenvflags nosync writemap\nsuffix \"dc=nimbo,dc=test\"\n"
        "rootdn \"cn=admin,dc=nimbo,dc=test\"\nrootpw adminpw\ndirectory " +
        directory +
        "/db\nindex objectClass,entryUUID eq\nindex uid,cn,memberUid,uidNumber,gidNumber,member eq\n"
        "access to attrs=userPassword by dn.exact=\"uid=writer,ou=people,dc=nimbo,dc=test\" write by self write by "
        "anonymous auth by * none\n"
        "access to * by dn.exact=\"uid=writer,ou=people,dc=nimbo,dc=test\" write by * read\n";
    text += _options.database;
    writeFile(_directory / "slapd.conf", text);
}

bool Slapd::tryToStart() {
    const std::string port = std::to_string(_port);
    std::string listeners = "ldap://127.0.0.1:" + port + "/ " + localUri();
    if (_securePort != 0) {
        listeners += " ldaps://127.0.0.1:" + std::to_string(_securePort) + "/";
    }
    return _server.start({"/usr/sbin/slapd", "-d", "none", "-f", (_directory / "slapd.conf").string(), "-h", listeners},
                         _directory / "slapd.out", _port);
}

void Slapd::start() {
    if (!tryToStart()) {
        throw std::runtime_error("slapd: " + contentsOf(_directory / "slapd.out"));
    }
}

void Slapd::apply(const char* tool, std::string_view ldif) const {
    const auto done = runProgram({tool, "-Q", "-Y", "EXTERNAL", "-H", localUri(), "-e", "relax"}, Errors::merge, ldif);
    if (done.status != 0) {
        throw std::runtime_error(std::string(tool) + ": " + done.output);
    }
}

void Slapd::add(std::string_view ldif) const {
    apply("/usr/bin/ldapadd", ldif);
}

void Slapd::modify(std::string_view ldif) const {
    apply("/usr/bin/ldapmodify", ldif);
}

}  // namespace support
