#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <algorithm>
#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::test::Errors;
using adminhost::test::ProgramResult;
using adminhost::test::runProgram;
using adminhost::test::SampleRoot;
using adminhost::test::SampleSizes;
using testing::HasSubstr;
namespace fs = std::filesystem;

// The text form of a file's value as read by Python's own property-list reader, which is independent of ours.
std::string plistText(const SampleRoot& root, const std::string& hostPath) {
    const ProgramResult result = runProgram(
        {"/usr/bin/python3", "-S", "-c", "import plistlib, sys; print(plistlib.load(open(sys.argv[1], 'rb')), end='')",
         root.disk(hostPath)});
    EXPECT_EQ(result.status, 0) << hostPath;
    return result.output;
}

TEST(MakeRoot, SettingsFilesAreProperyListsAtTheirPlaces) {
    const SampleRoot root;
    const std::string member = SampleRoot::uuidOf("member", "media1");
    EXPECT_EQ(plistText(root, "/Library/Preferences/com.brenn.lumioserverd.plist"),
              "{'member_uuid': '" + member + "', 'shared_filesystem': '/Library/SorvaneProducer/Shared'}");
    const std::string shared = "/Library/SorvaneProducer/Shared";
    EXPECT_THAT(plistText(root, shared + "/lumioserverd.plist"),
                HasSubstr("'library_version': '2.4', 'server_uuid': '"));
    EXPECT_THAT(plistText(root, shared + "/Server/member_preferences_" + member + ".plist"),
                HasSubstr("'server_host': 'media1.example.org', 'server_port': 8170"));
    EXPECT_THAT(plistText(root, shared + "/Server/cluster_preferences.plist"), HasSubstr("'nimbo_client_password': '"));
    EXPECT_EQ(plistText(root, shared + "/Server/Secrets/kek.plist"), "{'lumio_secret': 'bHVtaW8tc2FtcGxlLWtleQ=='}");
    EXPECT_EQ(plistText(root, "/var/lumio/server/.lumioserverd_startup_status.plist"), "{'error': 0}");
    EXPECT_TRUE(fs::exists(root.memberPreferencesPath()));
    EXPECT_TRUE(fs::exists(root.clusterPreferencesPath()));
    EXPECT_TRUE(fs::exists(root.identityPreferencesPath()));
}

TEST(MakeRoot, LocationFileNamesTheDatabaseAsAHostPath) {
    const SampleRoot root;
    EXPECT_THAT(root.read("/var/lumio/server/database.yml"),
                HasSubstr("production:\n  adapter: sqlite3\n  database: /var/lumio/server/db/lumio.sqlite3\n"));
    EXPECT_TRUE(fs::exists(root.databasePath()));
}

TEST(MakeRoot, LibraryHasADozenCamerasInEveryStatusWithDisabledOnesAndNulls) {
    const SampleRoot root;
    EXPECT_EQ(root.sql("select count(*) from cameras"), "12\n");
    EXPECT_EQ(root.sql("select count(*) from cameras where disabled = 't'"), "2\n");
    EXPECT_EQ(root.sql("select count(*) from cameras where disabled is null"), "4\n");
    EXPECT_EQ(root.sql("select count(*) from cameras where recording_status is null"), "1\n");
    EXPECT_EQ(root.sql("select distinct recording_status from cameras where recording_status is not null order by 1"),
              "capturing\ncapturing_audio_only\nidle\noffline\npaused\nstarting\nstopping\nuploading\n");
    EXPECT_EQ(root.sql("select count(*) from cameras where uuid <> upper(uuid) or length(uuid) <> 36"), "0\n");
}

TEST(MakeRoot, AccessListsNameUsersAndGroupsOfTheRootsOwnAccountFiles) {
    const SampleRoot root;
    EXPECT_EQ(
        root.sql("select record_uuid from access_control_entries where resource_type = 'Camera' and resource_id = '1'"),
        SampleRoot::uuidOf("group", "lecturers") + "\n" + SampleRoot::uuidOf("user", "anna") + "\n");
    EXPECT_THAT(root.read("/etc/passwd"), HasSubstr("\nanna:x:1001:1001:Anna Lindqvist,"));
    EXPECT_THAT(root.read("/etc/group"), HasSubstr("\nlecturers:x:1004:anna,ben,dmitri\n"));
}

TEST(MakeRoot, FortyJobsOfWhichSomeRunAndSomeNeverReachedTheGrid) {
    const SampleRoot root;
    EXPECT_EQ(root.sql("select count(*), count(nimbo_job_id), sum(nimbo_job_status = 'Running') from jobs"),
              "40|36|4\n");
}

TEST(MakeRoot, ProtectedPropertyIsWhatTheCipherToolDeciphers) {
    const SampleRoot root;
    root.write("/../cipher.txt", root.sql("select value from properties where name = 'mail_password'"));
    const ProgramResult plain =
        runProgram({"openssl", "enc", "-d", "-a", "-aes-128-cbc", "-K", "6c756d696f2d73616d706c652d6b6579", "-iv",
                    "4c756d696f50726f7065727479495631", "-in", root.directory() + "/cipher.txt"});
    EXPECT_EQ(plain.output, "correct horse battery staple, and a good deal more than one line of text");
    EXPECT_EQ(root.sql("select count(*) from properties where protect = 't'"), "3\n");
    EXPECT_EQ(root.sql("select instr(value, char(10)) from properties where name = 'mail_password'"), "77\n");
}

TEST(MakeRoot, WorkflowBundlesAreThereExceptTheRemovedOne) {
    const SampleRoot root;
    const std::string workflows = "/Library/SorvaneProducer/Shared/";
    EXPECT_EQ(root.sql("select count(*) from workflows"), "7\n");
    EXPECT_EQ(root.sql("select bundle_path from workflows where id = 1"), "Workflows/Publish.workflow\n");
    EXPECT_THAT(plistText(root, workflows + "Workflows/Publish.workflow/Contents/Info.plist"),
                HasSubstr("'Name': 'Publish'"));
    EXPECT_THAT(root.read(workflows + "Workflows/Publish.workflow/Contents/Resources/German.lproj/InfoPlist.strings"),
                HasSubstr("\"Name\" = \"Im Katalog veröffentlichen\";\n"));
    EXPECT_FALSE(fs::exists(root.disk(workflows + "Workflows/Removed.workflow")));
}

TEST(MakeRoot, WorkflowBundlesHaveEveryFormOfInformationFilesAndTables) {
    const SampleRoot root;
    const std::string workflows = "/Library/SorvaneProducer/Shared/Workflows/";
    const auto beginning = [&](const std::string& path) { return root.read(workflows + path).substr(0, 8); };
    const std::string table = ".lproj/InfoPlist.strings";
    EXPECT_THAT(beginning("Publish.workflow/Contents/Info.plist"), testing::StartsWith("<?xml"));
    EXPECT_EQ(beginning("AudioEpisode.workflow/Contents/Info.plist"), "bplist00");
    EXPECT_THAT(beginning("Publish.workflow/Contents/Resources/German" + table), testing::StartsWith("/*"));
    EXPECT_THAT(beginning("Publish.workflow/Contents/Resources/French" + table), testing::StartsWith("\xFF\xFE/"));
    EXPECT_THAT(beginning("Publish.workflow/Contents/Resources/ja" + table), testing::StartsWith("<?xml"));
    EXPECT_EQ(beginning("AudioEpisode.workflow/Contents/Resources/fr" + table), "bplist00");
    EXPECT_FALSE(fs::exists(root.disk(workflows + "Archive.workflow/Contents/Resources")));
    EXPECT_THAT(plistText(root, workflows + "TwoCameras.workflow/Contents/Info.plist"), HasSubstr("'Two Cameras'"));
}

TEST(MakeRoot, PropertyDescriptionsComeInThreeLanguages) {
    const SampleRoot root;
    const std::string bundle =
        root.disk("/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle/Contents/Resources/");
    for (const std::string language : {"English", "German", "French"}) {
        EXPECT_GT(fs::file_size(bundle + language + ".lproj/PropertyDescriptions.strings"), 100U) << language;
    }
}

TEST(MakeRoot, SizesSetTheNumberOfRows) {
    const SampleRoot root(SampleSizes{
        .cameras = 100, .workflows = 20, .properties = 30, .jobs = 50, .accessEntries = 5, .accounts = 300});
    EXPECT_EQ(root.sql("select (select count(*) from cameras), (select count(*) from workflows), (select count(*) from "
                       "properties), "
                       "(select count(*) from jobs), (select count(*) from access_control_entries)"),
              "100|20|30|50|600\n");
    EXPECT_EQ(root.sql("select count(distinct uuid) from cameras"), "100\n");
    const std::string passwd = root.read("/etc/passwd");
    EXPECT_EQ(std::count(passwd.begin(), passwd.end(), '\n'), 300);
    const SampleRoot none(
        SampleSizes{.cameras = 0, .workflows = 0, .properties = 0, .jobs = 0, .accessEntries = 0, .accounts = 1});
    EXPECT_EQ(
        none.sql(
            "select (select count(*) from cameras), (select count(*) from workflows), (select count(*) from jobs)"),
        "0|0|0\n");
}

TEST(MakeRoot, TheSameSizesMakeTheSameFiles) {
    const SampleRoot one;
    const SampleRoot other;
    const ProgramResult difference = runProgram({"diff", "-r", "--no-dereference", one.path(), other.path()});
    EXPECT_EQ(difference.status, 0) << difference.output;
}

TEST(MakeRoot, RefusesADirectoryThatIsNotEmpty) {
    const SampleRoot root;
    const ProgramResult result = runProgram({SOURCE_DIR "/demo/make-root", root.path()}, Errors::merge);
    EXPECT_EQ(result.status, 2);
    EXPECT_THAT(result.output, HasSubstr("is not empty"));
}

TEST(MakeRoot, RemovesItsDirectoryAtTheEnd) {
    std::string directory;
    {
        const SampleRoot root;
        directory = root.directory();
        EXPECT_TRUE(fs::exists(directory));
    }
    EXPECT_FALSE(fs::exists(directory));
}

}  // namespace
