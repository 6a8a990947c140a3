// A directory with 50,000 people: what is asked of the daemon does not depend on their number, and everyone is found.

#include "tests/support/PrometheusText.h"
#include "tests/system/jobs/Jobs.h"

#include <map>
#include <memory>
#include <optional>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Each;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::SizeIs;
using testing::StartsWith;

/// A host with so many accounts, and its daemon.
class Host {
  public:
    explicit Host(std::optional<int> accounts) : root({{}, {}, {}, {}, {}, accounts}) {}

    [[nodiscard]] Ran ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {ctlProgram, "--socket", daemon.socket()});
        return runBare(words);
    }
    /// The candidates for the last word.
    [[nodiscard]] std::vector<std::string> completed(std::vector<std::string> words) const {
        words.insert(words.begin(), {"complete", "--", "--socket", daemon.socket(), "--timeout", "60"});
        return linesOf(ctl(words).out);
    }
    /// How many requests of each kind the verb sends, and how many tools they run.
    [[nodiscard]] std::map<PrometheusText::Labels, double> requestsOf(const std::vector<std::string>& words) const {
        const auto before = requests();
        const Ran ran = ctl(words);
        EXPECT_EQ(ran.status, 0) << testing::PrintToString(words) << ran.err;
        auto sent = requests();
        for (const auto& [labels, count] : before) {
            sent[labels] -= count;
        }
        std::erase_if(sent, [](const auto& request) { return request.second == 0; });
        return sent;
    }

    const SampleRoot root;

  private:
    [[nodiscard]] std::map<PrometheusText::Labels, double> requests() const {
        PrometheusText metrics = parsePrometheusText(daemon.connect().get("/v1/metrics").body);
        auto counts = metrics.samples["adminhost_requests_total"];
        counts[{{"", "tools"}}] = metrics.sum("adminhost_tool_runs_total");
        return counts;
    }

    const DaemonProcess daemon{
        {{"--root", root.path(), "--plugin", BINARY_DIR "/lib/adminhost_lumio.so"}, {}, {}, true, {}, 0, -1}};
};

class ManyPeople : public testing::Test {
  protected:
    static void SetUpTestSuite() { many = std::make_unique<Host>(50'000); }
    static void TearDownTestSuite() { many.reset(); }

    static std::unique_ptr<Host> many;
};
std::unique_ptr<Host> ManyPeople::many;

TEST_F(ManyPeople, CompletionAsksForTheTypedLettersAndOffersTheLastPersonToo) {
    EXPECT_THAT(many->completed({"whois", "user04998"}), AllOf(SizeIs(10), Each(StartsWith("user04998"))));
    EXPECT_THAT(many->completed({"access", "user049989"}), ElementsAre("user049989"));
    EXPECT_THAT(many->completed({"camera", "list", "--allowed", "user04998"}), SizeIs(10));
    EXPECT_THAT(many->completed({"camera", "allow", "Roof", "--group", "course049"}),
                AllOf(SizeIs(10), Each(StartsWith("course049"))));
    EXPECT_THAT(many->completed({"camera", "allow", "Roof", "user"}), SizeIs(50)) << "more are of no use to a person";
}

TEST_F(ManyPeople, EverybodyIsFoundAndATypoIsNamed) {
    EXPECT_THAT(many->ctl({"whois", "user049989"}).out, HasSubstr("Person Number 49989"));
    EXPECT_EQ(many->ctl({"camera", "allow", "Studio A", "user049989"}).out,
              "cameras.\"Studio A\".users.user049989: (not allowed) -> (allowed): applied\n");
    EXPECT_THAT(many->ctl({"access", "user049989", "--restricted"}).out, HasSubstr("Studio A  in its list\n"));
    EXPECT_THAT(many->root.sql("select name from cameras join access_control_entries on resource_id = cameras.id where "
                               "record_uuid = '" +
                               SampleRoot::uuidOf("user", "user049989") + "'"),
                HasSubstr("Studio A\n"));
    const Ran typo = many->ctl({"whois", "user04998x"});
    EXPECT_EQ(typo.status, 2);
    EXPECT_THAT(typo.err, HasSubstr("person or group not found: user04998x; did you mean \"user04998"));
}

TEST_F(ManyPeople, NumberOfRequestsAndToolsIsThatOfASmallDirectory) {
    const Host few(std::nullopt);
    for (const Host* host : std::initializer_list<const Host*>{many.get(), &few}) {
        ASSERT_EQ(host->ctl({"access", "anna"}).status, 0) << "the daemon tries the database tool once";
    }
    for (const std::vector<std::string>& words : {std::vector<std::string>{"whois", "anna"},
                                                  {"access", "anna"},
                                                  {"camera", "list"},
                                                  {"camera", "list", "--allowed", "anna"},
                                                  {"camera", "show", "Roof"},
                                                  {"camera", "allow", "Roof", "ben"},
                                                  {"access", "ben", "--revoke"}}) {
        const auto sent = many->requestsOf(words);
        EXPECT_EQ(sent, few.requestsOf(words)) << testing::PrintToString(words);
        EXPECT_FALSE(sent.empty());
    }
}

}  // namespace
}  // namespace adminhost::test
