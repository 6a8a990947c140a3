// A directory server that is down, or never answers: nothing is mistaken for "nobody has access", and nobody waits.

#include "platform/json/Json.h"
#include "tests/support/SilentServer.h"
#include "tests/system/apply/ControlledService.h"

#include <chrono>
#include <filesystem>

namespace adminhost::test {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using Clock = std::chrono::steady_clock;

/// Two nodes: a server at the address, and the accounts of the sample root.
std::string nodes(const std::string& uri, const std::string& more = "") {
    return "[[directory.node]]\nname = \"/Example\"\nuri = [\"" + uri + "\"]\nbase = \"dc=example\"\n" + more +
           "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\n";
}

constexpr const char* reason = "the directory node \"/Example\" failed";

class ServerThatIsDown : public ControlledService {
  protected:
    ServerThatIsDown() : ControlledService(nodes("ldap://127.0.0.1:1")) {}

    [[nodiscard]] std::vector<std::string> configurationRuns() const {
        std::vector<std::string> runs;
        for (const ToolCall& call : root.toolCalls()) {
            if (call.tool == "/usr/bin/lumioconfig") {
                runs.push_back(call.arguments.front());
            }
        }
        return runs;
    }
};

TEST_F(ServerThatIsDown, ListingHasEmptyAccessListsAndReportsTheNodeOnce) {
    UnixHttp client = daemon.connect();
    const HttpReply reply = client.post("/v1/lumio/getCameras", "{}");
    EXPECT_EQ(reply.status, 200) << reply.body;
    ASSERT_TRUE(reply.headers.contains("adminhost-not-done"));
    EXPECT_EQ(reply.headers.at("adminhost-not-done"), "1");
    EXPECT_THAT(reply.body, HasSubstr("\"allowedUsersAndGroups\":[]"));
    EXPECT_THAT(reply.body, Not(HasSubstr("\"shortName\"")));
    EXPECT_THAT(client.get("/v1/requests/" + reply.headers.at("request-id")).body,
                HasSubstr("the directory node \\\"/Example\\\" failed"));
}

TEST_F(ServerThatIsDown, ExportFailsAndLeavesTheLastGoodFile) {
    const std::string exported = file("state.toml", "the last good one\n");
    const ProgramResult result = ctl({"export", exported});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr(reason));
    EXPECT_EQ(read(exported), "the last good one\n");
}

TEST_F(ServerThatIsDown, VerbsThatChangeAccessOrCompareItFailAndWriteNothing) {
    root.recordToolCalls();
    const std::string desired = file("desired.toml", "[cameras.\"Main hall\"]\nusers = []\n");
    const std::string before =
        root.sql("select * from access_control_entries; select * from cameras; select * from workflows");
    for (const std::vector<std::string>& words : {std::vector<std::string>{"plan", desired},
                                                  {"apply", desired},
                                                  {"camera", "allow", "Main hall", "ben"},
                                                  {"camera", "deny", "Main hall", "ben"},
                                                  {"camera", "access", "Main hall", "off"},
                                                  {"workflow", "allow", "Workflows/Publish.workflow", "ben"},
                                                  {"workflow", "deny", "Workflows/Publish.workflow", "editors"},
                                                  {"workflow", "access", "Workflows/Publish.workflow", "off"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 1) << words.front() << ": " << result.output;
        // Names are looked up before anything is sent, so that the directory itself says what is wrong.
        EXPECT_THAT(result.output, testing::AnyOf(HasSubstr(reason), HasSubstr("Can't contact LDAP server")))
            << words.front();
    }
    EXPECT_THAT(configurationRuns(), IsEmpty());
    EXPECT_EQ(root.sql("select * from access_control_entries; select * from cameras; select * from workflows"), before);
}

TEST_F(ServerThatIsDown, SettingIsSetAndRestoredAndRollbackOfAccessFails) {
    ASSERT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0);
    const ProgramResult setting = ctl({"rollback", "1"});
    EXPECT_EQ(setting.status, 0) << "it reads no access list: " << setting.output;
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n");

    const std::string uuid = root.sql("select uuid from cameras where name = 'Main hall'");
    ASSERT_EQ(daemon.connect()
                  .post("/v1/lumio/writeSettings", R"({"configuration":{"cameras":[{"_id_":")" +
                                                       uuid.substr(0, uuid.find('\n')) +
                                                       R"(","access_control_enabled":false}]}})")
                  .status,
              200);
    ASSERT_EQ(root.sql("select access_control_enabled from cameras where name = 'Main hall'"), "f\n");
    const ProgramResult access = ctl({"rollback", "r1"});
    EXPECT_EQ(access.status, 1);
    EXPECT_THAT(access.output, HasSubstr(reason));
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where name = 'Main hall'"), "f\n");
}

TEST_F(ServerThatIsDown, WhoisFailsWithTheReason) {
    const ProgramResult result = ctl({"whois", "anna"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr("127.0.0.1:1"));
    EXPECT_THAT(result.output, HasSubstr("DIRECTORY_UNAVAILABLE"));
}

TEST_F(ServerThatIsDown, LogNamesTheNodeAfterTheStart) {
    EXPECT_TRUE(daemon.waitForLog("adminhostd: the directory node \"/Example\" cannot be reached: "));
    const std::string log = daemon.log();
    EXPECT_LT(log.find("serves with the plug-ins"), log.find("cannot be reached"));
    EXPECT_THAT(log, Not(HasSubstr("\"/Local\"")));
}

/// A server that accepts connections and never answers.
class ServerThatIsSilent : private SilentServer, public ControlledService {
  protected:
    ServerThatIsSilent()
        : ControlledService("[directory]\nbudget_seconds = 1\n" +
                            nodes("ldap://127.0.0.1:" + std::to_string(SilentServer::port()))) {}
};

TEST_F(ServerThatIsSilent, DelaysNeitherTheStartNorRequestsThatDoNotNeedIt) {
    UnixHttp client = daemon.connect();
    EXPECT_EQ(client.post("/v1/lumio/getProperties", "{}").status, 200);
    EXPECT_THAT(daemon.log(), Not(HasSubstr("cannot be reached"))) << "which takes five seconds to be found out";
    EXPECT_TRUE(daemon.waitForLog("the directory node \"/Example\" cannot be reached"));
}

TEST_F(ServerThatIsSilent, RequestEndsAfterItsBudget) {
    UnixHttp client = daemon.connect();
    const auto start = Clock::now();
    const HttpReply reply = client.post("/v1/lumio/getCameras", "{}");
    const auto elapsed = Clock::now() - start;
    EXPECT_EQ(reply.status, 200);
    EXPECT_TRUE(reply.headers.contains("adminhost-not-done"));
    EXPECT_GE(elapsed, std::chrono::milliseconds(900));
    EXPECT_LT(elapsed, std::chrono::milliseconds(4500)) << "the time-out of one operation alone is 5 s";
}

}  // namespace
}  // namespace adminhost::test
