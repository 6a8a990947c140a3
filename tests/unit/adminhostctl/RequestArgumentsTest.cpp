#include "adminhostctl/Failure.h"
#include "adminhostctl/RequestArguments.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <map>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Array;
using adminhost::Data;
using adminhost::Date;
using adminhost::Dictionary;
using adminhost::Value;
using adminhost::ctl::describe;
using adminhost::ctl::DescribedKey;
using adminhost::ctl::Description;
using adminhost::ctl::ExitStatus;
using adminhost::ctl::Failure;
using adminhost::ctl::Sources;
using testing::HasSubstr;

/// Files with the contents that a test gives, and a person who types.
struct Given {
    std::map<std::string, std::string> files;
    std::string typed;
    bool terminal = false;
    bool clear = false;
    bool force = false;

    [[nodiscard]] Sources sources() const {
        return {[this](const std::string& path) {
                    const auto found = files.find(path);
                    if (found == files.end()) {
                        throw adminhost::ctl::usageError(path + ": No such file or directory");
                    }
                    return found->second;
                },
                [this](const std::string&) { return typed; },
                terminal,
                clear,
                {},
                {},
                force};
    }
};

Dictionary build(std::string_view command, const std::vector<std::string>& arguments, const Given& given = {},
                 Dictionary base = {}) {
    return adminhost::ctl::buildRequest(describe(command), std::move(base), arguments, given.sources());
}

std::string usageOf(std::string_view command, const std::vector<std::string>& arguments, const Given& given = {},
                    Dictionary base = {}) {
    try {
        build(command, arguments, given, std::move(base));
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        return failure.what();
    }
    ADD_FAILURE() << "no usage error";
    return {};
}

DescribedKey keyOf(const char* type) {
    DescribedKey key;
    key.path = "key";
    key.type = type;
    return key;
}
Value convert(const char* type, const std::string& text) {
    return adminhost::ctl::valueOfText(keyOf(type), text);
}
std::string refused(const char* type, const std::string& text) {
    try {
        convert(type, text);
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        return failure.what();
    }
    ADD_FAILURE() << type << " took " << text;
    return {};
}

TEST(BuildRequest, ADottedKeyMakesNestedDictionaries) {
    EXPECT_EQ(build("readSettings", {"optionalArguments.variant=getCameras"}),
              (Dictionary{{"optionalArguments", Dictionary{{"variant", "getCameras"}}}}));
}

TEST(BuildRequest, NoArgumentsMakeAnEmptyRequest) {
    EXPECT_TRUE(build("getCameras", {}).empty());
}

TEST(BuildRequest, ATextIsConvertedToTheTypeInWhichASettingIsEntered) {
    EXPECT_EQ(build("writeSettings", {"configuration.server_port=8170", "configuration.server_host=8170",
                                      "configuration.sorvane_capture_web_enabled=yes"}),
              (Dictionary{{"configuration", Dictionary{{"server_port", 8170},
                                                       {"server_host", "8170"},
                                                       {"sorvane_capture_web_enabled", true}}}}));
}

TEST(BuildRequest, ATextThatDoesNotFitItsKeyIsAUsageError) {
    EXPECT_EQ(usageOf("writeSettings", {"configuration.server_port=eighty"}),
              "configuration.server_port: \"eighty\" is not a whole number");
}

TEST(BuildRequest, JsonHasATypeOfItsOwn) {
    EXPECT_EQ(build("readSettings", {"optionalArguments.languages:=[\"de\", \"en\"]"}),
              (Dictionary{{"optionalArguments", Dictionary{{"languages", Array{"de", "en"}}}}}));
    EXPECT_EQ(build("writeSettings", {"configuration.server_port:=\"8170\""}),
              (Dictionary{{"configuration", Dictionary{{"server_port", "8170"}}}}));
}

TEST(BuildRequest, BrokenJsonIsAUsageErrorWithItsPlace) {
    EXPECT_THAT(usageOf("readSettings", {"optionalArguments:={\"a\" 1}"}),
                HasSubstr("optionalArguments: line 1, column 6: "));
    EXPECT_THAT(usageOf("readSettings", {"optionalArguments:=null"}), HasSubstr("null is not a value"));
}

TEST(BuildRequest, OnlyJsonBringsAKeyThatIsNotDescribed) {
    EXPECT_THAT(usageOf("readSettings", {"optionalArguments.variannt=getConfig"}),
                HasSubstr("has no key optionalArguments.variannt"));
    EXPECT_THAT(usageOf("readSettings", {"colour@file"}), HasSubstr("has no key colour"));
    EXPECT_EQ(build("readSettings", {"colour:=5"}), (Dictionary{{"colour", 5}}));
}

TEST(BuildRequest, AKeyForAnyValueAcceptsText) {
    EXPECT_EQ(build("getState", {"variant=withDetails"}), (Dictionary{{"variant", "withDetails"}}));
    EXPECT_EQ(build("getState", {"variant.deep.er=x"}),
              (Dictionary{{"variant", Dictionary{{"deep", Dictionary{{"er", "x"}}}}}}));
}

TEST(BuildRequest, AListAcceptsJsonOrAFileButNotText) {
    EXPECT_THAT(
        usageOf("readSettings", {"optionalArguments.languages=de"}),
        HasSubstr("the value is a list; use optionalArguments.languages:=JSON or optionalArguments.languages@FILE"));
    EXPECT_EQ(build("readSettings", {"optionalArguments.languages@f"}, {{{"f", " [\"de\"]\n"}}, "", false, false}),
              (Dictionary{{"optionalArguments", Dictionary{{"languages", Array{"de"}}}}}));
}

TEST(BuildRequest, NumbersNameTheElementsOfAList) {
    EXPECT_EQ(
        build("writeSettings", {"configuration.properties.0._newid_=yes", "configuration.properties.0.name=a",
                                "configuration.properties.1._id_=4", "configuration.properties.1.value=7"}),
        (Dictionary{{"configuration", Dictionary{{"properties", Array{Dictionary{{"_newid_", true}, {"name", "a"}},
                                                                      Dictionary{{"_id_", 4}, {"value", "7"}}}}}}}));
    EXPECT_THAT(usageOf("writeSettings", {"configuration.properties.1.name=a"}),
                HasSubstr("neither one of them nor the next"));
}

TEST(BuildRequest, ArgumentsReplaceWhatTheFileHolds) {
    const Dictionary base = {{"configuration", Dictionary{{"server_port", 1}, {"server_host", "a"}}}};
    EXPECT_EQ(build("writeSettings", {"configuration.server_port=2"}, {}, base),
              (Dictionary{{"configuration", Dictionary{{"server_port", 2}, {"server_host", "a"}}}}));
}

TEST(BuildRequest, AKeyBelowAValueThatIsNotADictionaryIsAUsageError) {
    EXPECT_THAT(usageOf("writeSettings", {"configuration.server_port=2"}, {}, {{"configuration", "text"}}),
                HasSubstr("server_port is not in a dictionary"));
}

TEST(BuildRequest, AKeyGivenTwiceIsAUsageError) {
    EXPECT_THAT(usageOf("getState", {"variant=withDetails", "variant=b"}), HasSubstr("given twice"));
}

TEST(BuildRequest, WordsOfAnotherFormAreUsageErrors) {
    for (const char* word : {"variant", "=x", "@x", ":=5", "", "a..b=x", ".a=x", "a.=x"}) {
        EXPECT_THAT(usageOf("getState", {word}), HasSubstr("is not ")) << word;
    }
}

TEST(BuildRequest, AValueMayHoldTheSignsThatSeparate) {
    EXPECT_EQ(build("validateSettings", {"nimbo_controller=a=b@c:=d"}), (Dictionary{{"nimbo_controller", "a=b@c:=d"}}));
    EXPECT_EQ(build("validateSettings", {"nimbo_controller="}), (Dictionary{{"nimbo_controller", ""}}));
}

TEST(BuildRequest, WordThatHasNoMeaningNeedsForce) {
    EXPECT_THAT(usageOf("getState", {"variant=other"}),
                HasSubstr("variant: other is not one of withDetails; --force writes it nevertheless"));
    Given given;
    given.force = true;
    EXPECT_EQ(build("getState", {"variant=other"}, given), (Dictionary{{"variant", "other"}}));
}

TEST(ValueOfText, NumberMayHaveTheUnitOfItsKeyAndNoOther) {
    DescribedKey key = keyOf("integer");
    key.unit = "megabytes";
    for (const char* const text : {"4096", "4096 MB", "4096mb", "4096 megabytes", "4096 megabyte"}) {
        EXPECT_EQ(adminhost::ctl::valueOfText(key, text), Value(4096)) << text;
    }
    for (const char* const text : {"4 GB", "4096 M B", "MB", "4096 MB 1"}) {
        EXPECT_THROW((void)adminhost::ctl::valueOfText(key, text), Failure) << text;
    }
    EXPECT_THAT(refused("integer", "4096 MB"), HasSubstr("is not a whole number")) << "a key without a unit";
}

TEST(ValueOfText, RangeIncludesItsBounds) {
    DescribedKey key = keyOf("integer");
    key.unit = "seconds";
    key.minimum = 1;
    key.maximum = 10;
    EXPECT_EQ(adminhost::ctl::rangeProblem(key, Value(1)), "");
    EXPECT_EQ(adminhost::ctl::rangeProblem(key, Value(10)), "");
    EXPECT_EQ(adminhost::ctl::rangeProblem(key, Value(0)), "is below 1 s");
    EXPECT_EQ(adminhost::ctl::rangeProblem(key, Value(11)), "is above 10 s");
    EXPECT_EQ(adminhost::ctl::rangeProblem(key, Value(std::uint64_t{1} << 63U)), "is above 10 s");
    EXPECT_EQ(adminhost::ctl::rangeProblem(keyOf("integer"), Value(-1)), "") << "without a range";
}

TEST(BuildRequest, ASecretIsRefusedOnTheCommandLine) {
    EXPECT_THAT(usageOf("validateSettings", {"nimbo_client_password=hunter2"}),
                testing::AllOf(HasSubstr("nimbo_client_password: a secret is not accepted"),
                               testing::Not(HasSubstr("hunter2"))));
    EXPECT_THAT(usageOf("validateSettings", {"nimbo_client_password:=\"hunter2\""}),
                HasSubstr("a secret is not accepted"));
    EXPECT_THAT(usageOf("writeSettings", {"configuration:={\"nimbo_client_password\": \"hunter2\"}"}),
                HasSubstr("configuration.nimbo_client_password: a secret is not accepted"));
}

TEST(BuildRequest, ASecretComesFromAFileWithoutItsLineEnd) {
    for (const char* content : {"hunter2", "hunter2\n", "hunter2\r\n"}) {
        EXPECT_EQ(build("validateSettings", {"nimbo_client_password@f"}, {{{"f", content}}, "", false, false}),
                  (Dictionary{{"nimbo_client_password", "hunter2"}}));
    }
    EXPECT_EQ(build("validateSettings", {"nimbo_client_password@f"}, {{{"f", "two\nlines\n\n"}}, "", false, false}),
              (Dictionary{{"nimbo_client_password", "two\nlines\n"}}));
}

TEST(BuildRequest, ASecretIsAskedForAtATerminalAndReadFromAPipe) {
    EXPECT_EQ(build("validateSettings", {"nimbo_client_password@-"}, {{}, "typed", true, false}),
              (Dictionary{{"nimbo_client_password", "typed"}}));
    EXPECT_EQ(build("validateSettings", {"nimbo_client_password@-"}, {{{"-", "piped\n"}}, "typed", false, false}),
              (Dictionary{{"nimbo_client_password", "piped"}}));
    EXPECT_EQ(build("validateSettings", {"shared_filesystem@-"}, {{{"-", "/srv\n"}}, "typed", true, false}),
              (Dictionary{{"shared_filesystem", "/srv"}}))
        << "what is no secret is read, not asked for";
}

TEST(BuildRequest, AnEmptySecretIsRefusedUnlessItIsMeant) {
    Given given{{{"f", "\n"}, {"-", ""}}, "", false, false};
    EXPECT_EQ(usageOf("validateSettings", {"nimbo_client_password@f"}, given),
              "nimbo_client_password: the value is empty; use --clear to remove the stored one");
    EXPECT_THAT(usageOf("validateSettings", {"nimbo_client_password@-"}, given), HasSubstr("the value is empty"));
    given.terminal = true;
    EXPECT_THAT(usageOf("validateSettings", {"nimbo_client_password@-"}, given), HasSubstr("the value is empty"));
    given.clear = true;
    EXPECT_EQ(build("validateSettings", {"nimbo_client_password@f"}, given),
              (Dictionary{{"nimbo_client_password", ""}}));
}

TEST(BuildRequest, AFileThatCannotServeIsAUsageError) {
    EXPECT_THAT(usageOf("getState", {"variant@missing"}), HasSubstr("missing: No such file"));
    EXPECT_THAT(usageOf("getState", {"variant@"}), HasSubstr("the name of a file is missing"));
    EXPECT_THAT(usageOf("validateSettings", {"shared_filesystem@f"}, {{{"f", "\xFF"}}, "", false, false}),
                HasSubstr("not UTF-8 text"));
}

TEST(ParseRequest, ReadsJsonAndPropertyLists) {
    const Dictionary wanted = {{"variant", "withDetails"}};
    EXPECT_EQ(adminhost::ctl::parseRequest("{\"variant\": \"withDetails\"}", "f"), wanted);
    EXPECT_EQ(adminhost::ctl::parseRequest(
                  "\n<plist version=\"1.0\"><dict><key>variant</key><string>withDetails</string></dict></plist>", "f"),
              wanted);
}

TEST(ParseRequest, NamesFileLineAndColumn) {
    for (const auto& [bytes, message] :
         std::map<std::string, std::string>{{"{\n  \"a\" 1}", "f: line 2, column "},
                                            {"[1]", "f: a request is a dictionary, not a list"},
                                            {"", "f: line 1, column "}}) {
        try {
            static_cast<void>(adminhost::ctl::parseRequest(bytes, "f"));
            ADD_FAILURE() << bytes;
        } catch (const Failure& failure) {
            EXPECT_EQ(failure.status(), ExitStatus::usage);
            EXPECT_THAT(failure.what(), HasSubstr(message));
        }
    }
}

TEST(ValueOfText, ReadsWholeNumbersOfTheWholeRange) {
    EXPECT_EQ(convert("integer", "-9223372036854775808"), Value(INT64_MIN));
    EXPECT_EQ(convert("integer", "18446744073709551615"), Value(UINT64_MAX));
    for (const char* text : {"", "1.0", "1e3", " 1", "1 ", "0x1", "18446744073709551616", "+1"}) {
        EXPECT_THAT(refused("integer", text), HasSubstr("is not a whole number")) << text;
    }
}

TEST(ValueOfText, ReadsNumbersBooleansAndText) {
    EXPECT_EQ(convert("real", "1.5"), Value(1.5));
    EXPECT_THAT(refused("real", "1,5"), HasSubstr("is not a number"));
    for (const char* text : {"yes", "TRUE", "on", "1", "t", "Y"}) {
        EXPECT_EQ(convert("boolean", text), Value(true)) << text;
    }
    for (const char* text : {"no", "False", "off", "0", "f"}) {
        EXPECT_EQ(convert("boolean", text), Value(false)) << text;
    }
    EXPECT_THAT(refused("boolean", "maybe"), HasSubstr("is not yes or no"));
    EXPECT_EQ(convert("text", "5"), Value("5"));
    EXPECT_EQ(convert("scalar", "5"), Value("5")) << "nothing says that it is entered as a number";
}

TEST(ValueOfText, ReadsDatesInUniversalAndInLocalTime) {
    const Value wanted(Date(std::chrono::seconds(1769846400)));
    EXPECT_EQ(convert("date", "2026-01-31T08:00:00Z"), wanted);
    EXPECT_EQ(convert("date", "2026-01-31 09:00:00"), wanted);
    EXPECT_EQ(convert("date", "2026-01-31 09:00"), wanted);
    EXPECT_EQ(convert("date", "2026-01-31"), Value(Date(std::chrono::seconds(1769846400 - 9 * 3600))));
    for (const char* text : {"yesterday", "2026-02-30", "2026-01-31 25:00", ""}) {
        EXPECT_THAT(refused("date", text), HasSubstr("is not a date")) << text;
    }
}

TEST(ValueOfText, DataComesFromAFile) {
    EXPECT_THAT(refused("data", "AAEC"), HasSubstr("use key@FILE"));
    Dictionary command = {{"name", "x"}, {"keys", Array{Dictionary{{"path", "blob"}, {"type", "data"}}}}};
    const Given given{{{"f", std::string("\0\xFF\n", 3)}}, "", false, false};
    EXPECT_EQ(adminhost::ctl::buildRequest(Description(command), {}, {"blob@f"}, given.sources()),
              (Dictionary{{"blob", Data{0, 0xFF, '\n'}}}));
}

/// The value of a verb's word.
Value word(const DescribedKey& key, const std::optional<std::string>& text, const Given& given = {}) {
    return adminhost::ctl::valueOfWord(key, text, given.sources());
}
std::string wordRefused(const DescribedKey& key, const std::optional<std::string>& text, const Given& given = {}) {
    try {
        (void)word(key, text, given);
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        return failure.what();
    }
    ADD_FAILURE() << "the word was taken";
    return {};
}
DescribedKey secretKey() {
    DescribedKey key = keyOf("text");
    key.secret = true;
    return key;
}

TEST(ValueOfWord, WordIsConvertedToTheTypeOfTheKey) {
    EXPECT_EQ(word(keyOf("integer"), "8170"), Value(8170));
    EXPECT_EQ(word(keyOf("text"), "8170"), Value("8170"));
    EXPECT_EQ(word(keyOf("text"), ""), Value(""));
    EXPECT_THAT(wordRefused(keyOf("integer"), "x"), HasSubstr("is not a whole number"));
}

TEST(ValueOfWord, WordAfterAnAtSignIsAFileOrStandardInput) {
    const Given given{{{"port", "8170\n"}, {"-", "typed\n"}, {"bytes", "\xFF"}}, "", false, false};
    EXPECT_EQ(word(keyOf("integer"), "@port", given), Value(8170));
    EXPECT_EQ(word(keyOf("text"), "@-", given), Value("typed"));
    EXPECT_THAT(wordRefused(keyOf("text"), "@bytes", given), HasSubstr("not UTF-8"));
    EXPECT_THAT(wordRefused(keyOf("text"), "@missing", given), HasSubstr("No such file"));
    EXPECT_THAT(wordRefused(keyOf("text"), "@", given), HasSubstr("the name of a file is missing"));
}

TEST(ValueOfWord, MissingWordIsAskedForOnlyAtATerminalAndOnlyForASecret) {
    const Given terminal{{}, "typed", true, false};
    EXPECT_EQ(word(secretKey(), std::nullopt, terminal), Value("typed"));
    EXPECT_EQ(word(secretKey(), "@-", terminal), Value("typed"));
    EXPECT_THAT(wordRefused(secretKey(), std::nullopt), HasSubstr("@FILE or @-"));
    EXPECT_THAT(wordRefused(keyOf("text"), std::nullopt, terminal), HasSubstr("TEXT, @FILE or @-"));
}

TEST(ValueOfWord, MissingSecretIsEmptyOnlyWhenItIsToBeCleared) {
    Given given{{}, "", true, false};
    EXPECT_THAT(wordRefused(secretKey(), std::nullopt, given), HasSubstr("the value is empty; use --clear"));
    given.clear = true;
    EXPECT_EQ(word(secretKey(), std::nullopt, given), Value(""));
    EXPECT_THAT(wordRefused(keyOf("text"), std::nullopt, given), HasSubstr("the value is missing"));
}

TEST(ValueOfWord, SecretOnTheCommandLineIsRefusedAndNotRepeated) {
    const std::string message = wordRefused(secretKey(), "planted-password", {{}, "typed", true, false});
    EXPECT_THAT(message, HasSubstr("use @FILE, or @- to be asked"));
    EXPECT_THAT(message, testing::Not(HasSubstr("planted-password")));
    EXPECT_THAT(wordRefused(secretKey(), ""), HasSubstr("a secret is not accepted"));
    EXPECT_EQ(word(secretKey(), "@file", {{{"file", "from the file\n"}}, "typed", true, false}),
              Value("from the file"));
}

}  // namespace
