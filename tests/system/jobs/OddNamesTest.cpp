// Names that a person would not choose: the service's own clients and its database accept them.

#include "tests/system/jobs/Jobs.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class OddNames : public testing::Test {
  protected:
    [[nodiscard]] Ran ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {ctlProgram, "--socket", daemon.socket()});
        return runBare(words);
    }
    /// Gives a camera of the sample another name. A quote is doubled in a statement.
    void rename(const std::string& camera, const std::string& name) const {
        std::string quoted;
        for (const char c : name) {
            quoted.append(c == '\'' ? 2 : 1, c);
        }
        root.sql("update cameras set name = '" + quoted + "' where uuid = '" + SampleRoot::uuidOf("camera", camera) +
                 "'");
    }
    [[nodiscard]] std::string accessOf(const std::string& uuid) const {
        return root.sql("select access_control_enabled from cameras where uuid = '" + uuid + "'");
    }

    const SampleRoot root;
    const DaemonProcess daemon{
        {{"--root", root.path(), "--plugin", BINARY_DIR "/lib/adminhost_lumio.so"}, {}, {}, true, {}, 0, -1}};
};

TEST_F(OddNames, CameraWithAnyNameIsListedShownAndChanged) {
    const std::string uuid = SampleRoot::uuidOf("camera", "Roof");
    for (const auto& [name, shown] :
         std::vector<std::pair<std::string, std::string>>{{"it's a \"hall\"", "it's a \"hall\""},
                                                          {"-rf", "-rf"},
                                                          {"--help", "--help"},
                                                          {"\xD7\x92\xD7\x92 hall", "\xD7\x92\xD7\x92 hall"},
                                                          {"hall \xE2\x80\xAE"
                                                           "1",
                                                           "hall \\u202e1"},
                                                          {"a=b:=c@d", "a=b:=c@d"},
                                                          {std::string(4096, 'n'), std::string(4096, 'n')}}) {
        rename("Roof", name);
        const std::string brief = name.substr(0, 20);
        EXPECT_THAT(linesOf(ctl({"camera", "list", "--names"}).out), testing::Contains(shown)) << brief;
        const Ran show = ctl({"camera", "show", "--", name});
        EXPECT_EQ(show.status, 0) << brief << show.err;
        EXPECT_THAT(show.out, HasSubstr(uuid)) << brief;
        for (const auto& [word, stored] : {std::pair{"on", "t\n"}, {"off", "f\n"}}) {
            const Ran access = ctl({"camera", "access", "--", name, word});
            EXPECT_EQ(access.status, 0) << brief << access.err;
            EXPECT_THAT(access.out, AllOf(testing::EndsWith(": applied\n"), Not(HasSubstr("\xE2\x80\xAE"))));
            EXPECT_EQ(accessOf(uuid), stored) << brief;
        }
    }
}

TEST_F(OddNames, ExportedFileNamesThemSoThatNothingDiffers) {
    rename("Roof", "it's a \"hall\"\\");
    rename("Studio A", "-rf");
    rename("Studio B", "-rf");
    const std::string file = root.directory() + "/host.toml";
    ASSERT_EQ(ctl({"export", file}).status, 0);
    const Ran plan = ctl({"plan", file});
    EXPECT_EQ(plan.status, 0) << plan.err;
    EXPECT_EQ(plan.out, "no change\n");
    EXPECT_THAT(contentOf(file), HasSubstr(SampleRoot::uuidOf("camera", "Studio B"))) << "a name of two cameras";
}

TEST_F(OddNames, PropertyIsWrittenOrRefusedAsAWhole) {
    const std::string all = "select count(*) from properties";
    const std::string before = root.sql(all);
    for (const std::string name : {"a\"b", "a\nb"}) {
        const Ran refused = ctl({"property", "set", "--", name, "x"});
        EXPECT_EQ(refused.status, 1) << name;
        EXPECT_THAT(refused.err, HasSubstr("configuration.properties.0.name"));
    }
    EXPECT_EQ(root.sql(all), before);
    for (const std::string& name : {std::string("it's"), std::string("-x"), std::string(4096, 'p')}) {
        const Ran set = ctl({"property", "set", "--", name, "-value 'quoted'"});
        EXPECT_EQ(set.status, 0) << set.err;
        EXPECT_EQ(ctl({"property", "remove", "--", name}).status, 0);
        EXPECT_EQ(root.sql(all), before);
    }
}

}  // namespace
}  // namespace adminhost::test
