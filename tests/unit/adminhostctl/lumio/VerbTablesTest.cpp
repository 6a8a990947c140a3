// The tables of verbs: what help shows of a row must be true.

#include "adminhostctl/GeneralVerbs.h"
#include "adminhostctl/desired/DesiredVerbs.h"
#include "adminhostctl/lumio/LumioVerbs.h"
#include "adminhostctl/lumio/ServiceVerbs.h"
#include "adminhostctl/lumio/VerbExamples.h"

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

std::vector<Verb> allVerbs() {
    std::vector<Verb> all;
    for (const auto& table : {serviceVerbs(), generalVerbs(), lumioVerbs(), desiredVerbs()}) {
        all.insert(all.end(), table.begin(), table.end());
    }
    addExamples(all);
    return all;
}

std::vector<VerbOption> allOptions() {
    std::vector<VerbOption> all;
    for (const auto& table : {generalOptions(), lumioOptions(), serviceOptions(), desiredOptions()}) {
        all.insert(all.end(), table.begin(), table.end());
    }
    return all;
}

/// The words of an example, as a shell splits them.
std::vector<std::string> split(std::string_view example) {
    std::vector<std::string> words(1);
    bool quoted = false;
    for (const char c : example) {
        if (c == '\'') {
            quoted = !quoted;
        } else if (c == ' ' && !quoted) {
            words.emplace_back();
        } else {
            words.back() += c;
        }
    }
    return words;
}

/// The arguments of an example for its verb, without options. Options that the verb does not have are failures.
std::vector<std::string> argumentsOf(const Verb& verb, std::string_view example) {
    std::vector<std::string> plain;
    const std::vector<std::string> words = split(example);
    for (std::size_t i = 0; i < words.size(); ++i) {
        if (words[i] == "--format" || words[i] == "--languages" || words[i] == "--timeout" || words[i] == "--socket" ||
            words[i] == "--host") {
            ++i;  // every verb has them
        } else if (words[i].starts_with("-") && words[i] != "-" && words[i] != "--names" && words[i] != "--clear") {
            const std::vector<VerbOption> options = allOptions();
            const auto option = std::find_if(options.begin(), options.end(), [&](const VerbOption& one) {
                return one.name == words[i] || one.brief == words[i];
            });
            if (option == options.end() || !belongsTo(*option, verb)) {
                ADD_FAILURE() << '"' << example << "\" has the option " << words[i];
                return plain;
            }
            i += option->argument.empty() ? 0 : 1;
        } else {
            plain.push_back(words[i]);
        }
    }
    const std::size_t own = verb.words.find(' ') == std::string_view::npos ? 1 : 2;
    EXPECT_GE(plain.size(), own) << example;
    EXPECT_TRUE(beginsWith(verb, std::span(plain).first(own))) << example;
    plain.erase(plain.begin(), plain.begin() + static_cast<std::ptrdiff_t>(own));
    return plain;
}

TEST(VerbTables, EveryVerbHasTwoExamplesThatItAccepts) {
    for (const Verb& verb : allVerbs()) {
        EXPECT_NE(verb.examples[0], verb.examples[1]) << verb.words;
        for (const std::string_view example : verb.examples) {
            ASSERT_FALSE(example.empty()) << verb.words;
            const std::size_t count = argumentsOf(verb, example).size();
            EXPECT_GE(count, verb.least) << example;
            EXPECT_LE(count, verb.most) << example;
        }
    }
}

TEST(VerbTables, EveryOptionBelongsToAVerb) {
    const std::vector<Verb> verbs = allVerbs();
    for (const VerbOption& option : allOptions()) {
        EXPECT_TRUE(std::any_of(verbs.begin(), verbs.end(), [&](const Verb& verb) { return belongsTo(option, verb); }))
            << option.name;
    }
}

TEST(VerbTables, OptionBelongsToTheVerbsWhoseArgumentsNameIt) {
    const Verb verb{"a", "NAME [--no-protect|--save] [-f]", "", 0, 0, nullptr, {}};
    EXPECT_TRUE(belongsTo({"--no-protect", "", ""}, verb));
    EXPECT_TRUE(belongsTo({"--save", "", ""}, verb));
    EXPECT_TRUE(belongsTo({"--follow", "", "", {}, "-f"}, verb));
    EXPECT_FALSE(belongsTo({"--protect", "", ""}, verb));
    EXPECT_FALSE(belongsTo({"--no", "", ""}, verb));
}

TEST(VerbTables, SecondWordThatIsMissingOrWrongIsSaidInTheWordsThatWereTyped) {
    const std::vector<Verb> verbs = allVerbs();
    const auto messageOf = [&](const std::vector<std::string>& words) -> std::string {
        try {
            (void)verbOf(verbs, words);
        } catch (const Failure& failure) {
            return failure.what();
        }
        return {};
    };
    EXPECT_EQ(messageOf({"settings"}), "\"settings\" needs another word: settings get, settings set");
    EXPECT_EQ(messageOf({"settings", "gte", "server_port"}),
              "not a verb: \"settings gte\"; did you mean \"settings get\"?; the verbs are settings get, settings set");
    EXPECT_EQ(messageOf({"status"}), "");
    EXPECT_EQ(verbOf(verbs, {"readSettings"}), nullptr);
}

}  // namespace
}  // namespace adminhost::ctl
