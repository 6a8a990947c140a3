// Settings written to file systems that are missing, read-only or full. The test mounts real ones in namespaces of its
// own, in which every account is the superuser.

#include "adminhostd/SettingsHistory.h"
#include "handler/LumioRequestHandler.h"
#include "platform/plist/PropertyList.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/TemporaryRoot.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <stdexcept>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::HostPath;
using adminhost::Value;
using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
constexpr std::string_view memberFile = "/shared/Server/member_preferences_M.plist";
/// A separate file system at a host path.
class Mount : public adminhost::test::Mount {
  public:
    Mount(const adminhost::test::TemporaryRoot& root, std::string_view place,
          const char* options = adminhost::test::smallFileSystem)
        : adminhost::test::Mount(root.path(place), options) {}
};

/// While it exists, the superuser cannot open files of mode 000.
class WithoutAccessPrivileges {
  public:
    WithoutAccessPrivileges() {
        __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
        check(::syscall(SYS_capget, &header, _former.data()));
        auto data = _former;
        data[0].effective &= ~((1U << CAP_DAC_OVERRIDE) | (1U << CAP_DAC_READ_SEARCH));
        check(::syscall(SYS_capset, &header, data.data()));
    }
    WithoutAccessPrivileges(const WithoutAccessPrivileges&) = delete;
    WithoutAccessPrivileges& operator=(const WithoutAccessPrivileges&) = delete;
    ~WithoutAccessPrivileges() {
        __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
        ::syscall(SYS_capset, &header, _former.data());
    }

  private:
    static void check(long status) {
        if (status != 0) {
            throw std::runtime_error(std::string("capabilities: ") + std::strerror(errno));
        }
    }
    std::array<__user_cap_data_struct, 2> _former{};
};

class FileSystems : public testing::Test {
  protected:
    void SetUp() override {
        for (const char* script : {"setup_lumioserverd_preferences", "setup_lumioserverd_library"}) {
            root.writeTool(std::string("/usr/share/sorvaneproducer/lumioserverd/script/") + script,
                           "#!/bin/sh\nexit 0\n");
        }
        fs::create_directories(root.path("/var/lumio/server"));
        makeIdentity();
    }
    void makeIdentity() const {
        root.writePropertyList(identityFile,
                               "<key>shared_filesystem</key><string>/shared</string>"
                               "<key>member_uuid</key><string>M</string>");
    }
    void makeShared() const {
        root.writePropertyList(clusterFile, "<key>nimbo_client_username</key><string>grid</string>");
        root.writePropertyList(memberFile, "<key>server_port</key><integer>8170</integer>");
    }
    /// Writes settings to all three files.
    Dictionary write() {
        log.lines.clear();
        const Dictionary configuration{
            {"member_uuid", "M"}, {"nimbo_client_username", "second"}, {"server_port", 9000}};
        return handler.writeSettingsWithRequest({{"configuration", configuration}}).dictionary();
    }
    /// Every file below the place, with its bytes.
    [[nodiscard]] std::map<std::string, std::string> below(std::string_view place) const {
        std::map<std::string, std::string> files;
        for (const auto& entry : fs::recursive_directory_iterator(root.path(place))) {
            if (entry.is_regular_file() && entry.path().filename() != "filling") {
                const std::string host = '/' + fs::relative(entry.path(), root.path("/")).string();
                files[host] = root.read(host);
            }
        }
        return files;
    }
    void expectRefused(const Dictionary& answer, std::string_view file, const char* reason) const {
        EXPECT_EQ(answer.get("writeStatus"), Value(400));
        ASSERT_NE(answer.get("errorDescription").string(), nullptr);
        EXPECT_THAT(*answer.get("errorDescription").string(), AllOf(HasSubstr(std::string(file)), HasSubstr(reason)));
        EXPECT_FALSE(handler.checkSetupDone());
    }
    void expectTaken(const Dictionary& answer) const {
        EXPECT_EQ(answer.get("writeStatus"), Value(0));
        EXPECT_EQ(adminhost::readPropertyList(adminhost::diskPath(HostPath(std::string(memberFile)))),
                  Value(Dictionary{{"server_port", 9000}}));
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

TEST_F(FileSystems, MissingSharedFileSystemIsAFailedWriteAndNothingIsMadeInItsPlace) {
    {
        const Mount shared(root, "/shared");
        makeShared();
    }
    expectRefused(write(), clusterFile, "No such file or directory");
    EXPECT_TRUE(fs::is_empty(root.path("/shared"))) << "a file written there would be hidden by the next mount";
}

TEST_F(FileSystems, ReadOnlySharedFileSystemIsAFailedWriteAndItsFilesStay) {
    const Mount shared(root, "/shared");
    makeShared();
    const auto before = below("/shared");
    shared.makeReadOnly();
    expectRefused(write(), clusterFile, "Read-only file system");
    EXPECT_EQ(below("/shared"), before);
}

TEST_F(FileSystems, FullSharedFileSystemIsAFailedWriteAndItsFilesStayUntilThereIsRoom) {
    const Mount shared(root, "/shared");
    makeShared();
    const auto before = below("/shared");
    shared.fill();
    expectRefused(write(), clusterFile, "No space left on device");
    EXPECT_EQ(below("/shared"), before) << "and no temporary file is left";
    shared.makeRoom();
    expectTaken(write());
    EXPECT_EQ(below("/shared").size(), before.size());
}

TEST_F(FileSystems, SharedFileSystemWithoutRoomForAnotherFileIsAFailedWrite) {
    // The root and "Server", and the two settings files.
    const Mount shared(root, "/shared", "nr_inodes=4,mode=755");
    makeShared();
    const auto before = below("/shared");
    expectRefused(write(), clusterFile, "No space left on device");
    EXPECT_EQ(below("/shared"), before);
}

TEST_F(FileSystems, ReadOnlyPlaceOfTheIdentityPreferencesEndsTheWriteBeforeTheSharedFileSystem) {
    const Mount preferences(root, "/Library/Preferences");
    makeIdentity();
    makeShared();
    const auto before = below("/shared");
    preferences.makeReadOnly();
    expectRefused(write(), identityFile, "Read-only file system");
    EXPECT_EQ(below("/shared"), before);
}

TEST_F(FileSystems, FullPlaceOfTheIdentityPreferencesLeavesThemAsTheyWere) {
    const Mount preferences(root, "/Library/Preferences");
    makeIdentity();
    makeShared();
    const auto before = below("/Library");
    preferences.fill();
    expectRefused(write(), identityFile, "No space left on device");
    EXPECT_EQ(below("/Library"), before);
    preferences.makeRoom();
    expectTaken(write());
}

TEST_F(FileSystems, UnreadableFileThatCannotBeKeptOnAReadOnlyFileSystemStays) {
    const Mount shared(root, "/shared");
    root.write(clusterFile, "precious text that is no property list");
    const auto before = below("/shared");
    shared.makeReadOnly();
    expectRefused(write(), clusterFile, "Read-only file system");
    EXPECT_EQ(below("/shared"), before);
    EXPECT_THAT(log.lines, ElementsAre(AllOf(HasSubstr("cluster_preferences.plist cannot be loaded or kept: "),
                                             HasSubstr("Read-only file system"))));
}

TEST_F(FileSystems, UnreadableFileIsKeptAlsoWhereTheNewOneFindsNoRoom) {
    const Mount shared(root, "/shared");
    root.write(clusterFile, "precious text that is no property list");
    shared.fill();
    expectRefused(write(), clusterFile, "No space left on device");
    for (const auto& [path, text] : below("/shared")) {
        EXPECT_EQ(text, "precious text that is no property list") << path;
    }
    EXPECT_EQ(root.read(clusterFile), "precious text that is no property list");
}

TEST_F(FileSystems, FileThatThisProcessMayNotReadIsMovedAsideAndReplaced) {
    makeShared();
    const std::string before = root.read(memberFile);
    fs::permissions(root.path(memberFile), fs::perms::none);
    {
        const WithoutAccessPrivileges closed;
        ASSERT_FALSE(std::ifstream(root.path(memberFile)).is_open()) << "it can be read";
        expectTaken(write());
    }
    EXPECT_THAT(log.lines, ElementsAre(HasSubstr("member_preferences_M.plist cannot be loaded; it is kept as ")));
    int kept = 0;
    for (const auto& [path, text] : below("/shared")) {
        kept += path.starts_with(std::string(memberFile) + ".unreadable-") && text == before ? 1 : 0;
    }
    EXPECT_EQ(kept, 1);
}

TEST_F(FileSystems, MarkerOnAReadOnlyFileSystemIsLoggedAndTheSettingsAreWritten) {
    makeShared();
    const Mount state(root, "/var/lumio/server");
    state.makeReadOnly();
    expectTaken(write());
    EXPECT_FALSE(handler.checkSetupDone());
    EXPECT_THAT(log.lines,
                Contains("adminhost_lumio: failed to create file at path: /var/lumio/server/.lumio_setup_done"));
}

TEST_F(FileSystems, HistoryWithoutRoomIsAnErrorThatLeavesNoHalfEntry) {
    const Mount state(root, "/var/lib/adminhostd");
    root.write(identityFile, std::string(40'000, 'x'));
    const adminhost::SettingsHistory history("lumio", {{"a", false}});
    const std::vector<HostPath> files{HostPath(std::string(identityFile))};
    ASSERT_TRUE(history.keep(files, {}, {}));
    const auto before = below("/var/lib/adminhostd");
    const auto full = history.keep(files, {}, {});
    ASSERT_FALSE(full);
    EXPECT_THAT(*full.error().description, HasSubstr("No space left on device"));
    EXPECT_EQ(below("/var/lib/adminhostd"), before);
    EXPECT_EQ(history.settingsEntries().size(), 1U);

    state.makeReadOnly();
    const auto refused = history.keep(files, {}, {});
    ASSERT_FALSE(refused);
    EXPECT_THAT(*refused.error().description, HasSubstr("Read-only file system"));
}

}  // namespace
}  // namespace lumio

int main(int argc, char** argv) {
    adminhost::test::enterOwnMounts(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
