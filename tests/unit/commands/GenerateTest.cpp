// The generator rejects faulty descriptions, so that a typo is found while building.

#include "tests/support/Program.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using testing::HasSubstr;

constexpr const char* sound = R"(order = 1
access = "read"
summary = "Do it"
[keys.a]
type = "text"
help = "An A."
[example]
request = '{"a": "x"}'
)";

/// A directory with a copy of the generator and descriptions of its own.
class Generate : public testing::Test {
  protected:
    void SetUp() override {
        std::string name = (std::filesystem::temp_directory_path() / "generate.XXXXXX").string();
        ASSERT_NE(::mkdtemp(name.data()), nullptr);
        _directory = name;
        std::filesystem::copy_file(std::string(SOURCE_DIR) + "/commands/generate.py", _directory / "generate.py");
    }
    void TearDown() override { std::filesystem::remove_all(_directory); }

    void write(const char* file, const std::string& text) const { std::ofstream(_directory / file) << text; }

    /// The generator's output, followed by its exit status.
    std::string run(const std::string& what, const std::string& file) const {
        const auto result = adminhost::test::runProgram(
            {"/usr/bin/python3", "-B", (_directory / "generate.py").string(), what, (_directory / file).string()},
            adminhost::test::Errors::merge);
        return result.output + "status " + std::to_string(result.status);
    }
    std::string table() const { return run("table", "table.cpp"); }

    /// The generator's output for the valid description with one text replaced by another.
    std::string with(const std::string& from, const std::string& to) const {
        std::string text = sound;
        text.replace(text.find(from), from.size(), to);
        write("doIt.toml", text);
        return table();
    }

    std::filesystem::path _directory;
};

TEST_F(Generate, AcceptsAValidDescription) {
    write("doIt.toml", sound);
    EXPECT_EQ(table(), "status 0");
    EXPECT_TRUE(std::filesystem::exists(_directory / "table.cpp"));
}

TEST_F(Generate, RefusesWhatIsNotRightAndNamesTheFile) {
    EXPECT_THAT(with("summary", "sumary"), testing::AllOf(HasSubstr("doIt.toml: unknown word"), HasSubstr("status 1")));
    EXPECT_THAT(with("\"text\"", "\"string\""), HasSubstr("doIt.toml: key a: type must be one of"));
    EXPECT_THAT(with("help = \"An A.\"", ""), HasSubstr("key a: help is missing"));
    EXPECT_THAT(with("help", "rules = [\"safe\"]\nhelp"), HasSubstr("key a: unknown rule"));
    EXPECT_THAT(with("[keys.a]", "[keys.\"b.a\"]"), HasSubstr("key b.a: b is not described"));
    EXPECT_THAT(with("{\"a\": \"x\"}", "{\"a\": 5}"), HasSubstr("example's request: a is not a text"));
    EXPECT_THAT(with("{\"a\": \"x\"}", "{\"z\": 5}"), HasSubstr("example's request: z is not described"));
    EXPECT_THAT(with("order = 1", "order = "), HasSubstr("doIt.toml: "));
    EXPECT_THAT(with("access = \"read\"\n", ""), HasSubstr("doIt.toml: access must be one of"));
    EXPECT_THAT(with("\"read\"", "\"all\""), HasSubstr("doIt.toml: access must be one of"));
    EXPECT_THAT(with("order = 1", "order = 1\ndeadline_seconds = 0"), HasSubstr("deadline_seconds must be"));
    EXPECT_THAT(with("order = 1", "order = 1\nneeds = [1]"), HasSubstr("needs must be a list of names"));
}

TEST_F(Generate, RangeOfANumberMustBeOne) {
    EXPECT_THAT(with("help", "minimum = 1\nmaximum = 9\nunit = \"minutes\"\nhelp"), HasSubstr("status 0"));
    EXPECT_THAT(with("help", "minimum = 2\nmaximum = 1\nhelp"), HasSubstr("key a: minimum is above maximum"));
    EXPECT_THAT(with("help", "maximum = \"9\"\nhelp"), HasSubstr("key a: not a whole number"));
}

TEST_F(Generate, RequestKeysAreTakenOverFromOtherCommandsAndFromTheSameOne) {
    write("doIt.toml", sound);
    std::string text = sound;
    text.replace(0, 9, "order = 2");
    write("doThat.toml", text +
                             "[keys.b]\ntype = \"dictionary\"\nhelp = \"A B.\"\n"
                             "[include.keys]\n\"b.c\" = \"doIt:a\"\n\"b.d\" = \"doThat:a\"\n");
    EXPECT_EQ(table(), "status 0");
    std::ifstream file(_directory / "table.cpp");
    const std::string made(std::istreambuf_iterator<char>(file), {});
    EXPECT_THAT(made, HasSubstr("\"b.c\""));
    EXPECT_THAT(made, HasSubstr("\"b.d\""));
    write("doThat.toml", text + "[include.keys]\n\"b\" = \"doIt:z\"\n");
    EXPECT_THAT(table(), HasSubstr("doThat.toml: include: doIt:z is not described"));
    write("doThat.toml", text + "[include.keys]\n\"b\" = \"doNothing:a\"\n");
    EXPECT_THAT(table(), HasSubstr("no command doNothing"));
    write("doIt.toml", std::string(sound) + "[include.keys]\n\"x\" = \"doThat:a\"\n");
    write("doThat.toml", text + "[include.keys]\n\"y\" = \"doIt:a\"\n");
    EXPECT_THAT(table(), HasSubstr("goes round in a circle"));
}

TEST_F(Generate, RefusesWordsOfTheDesiredStateThatNameNothing) {
    EXPECT_THAT(with("order = 1", "order = 1\nstate = \"change\""), HasSubstr("state is read, write, try or names"));
    EXPECT_THAT(with("help", "identity = \"_id_\"\nhelp"), HasSubstr("key a: identity is not described"));
    EXPECT_THAT(with("help", "secret_if = \"hidden\"\nhelp"), HasSubstr("key a: secret_if is not described"));
    EXPECT_THAT(with("help", "looked_up = \"always\"\nhelp"), HasSubstr("key a: unknown word in looked_up"));
    EXPECT_THAT(with("help", "restart = [\"doThat\"]\nhelp"), HasSubstr("key a: restart names an unknown command"));
    EXPECT_THAT(with("order = 1", "order = 1\nparts = { all = '{\"b\": 1}' }"),
                HasSubstr("part all: b is not described"));
    EXPECT_THAT(with("help", "file = \"main\"\nlocates = [\"main\"]\nhelp"), HasSubstr("status 0"));
    EXPECT_THAT(with("order = 1", "order = 1\nstate = \"write\""), HasSubstr("status 0"));
    write("doThat.toml", std::string(sound).replace(0, 9, "order = 2\nstate = \"write\""));
    EXPECT_THAT(table(), HasSubstr("two commands have state = write"));
}

TEST_F(Generate, RefusesTwoCommandsOfTheSameOrder) {
    write("doIt.toml", sound);
    write("doThat.toml", sound);
    EXPECT_THAT(table(), HasSubstr("doIt.toml and doThat.toml have the same order, 1"));
}

TEST_F(Generate, NoticesAStalePage) {
    write("doIt.toml", sound);
    EXPECT_EQ(run("docs", "page.md"), "status 0");
    EXPECT_EQ(run("check", "page.md"), "status 0");
    write("page.md", "something else");
    EXPECT_THAT(run("check", "page.md"), testing::AllOf(HasSubstr("is stale"), HasSubstr("status 1")));
}

}  // namespace
