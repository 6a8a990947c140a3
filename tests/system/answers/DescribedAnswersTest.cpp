// Runs every reading command of the plug-in on the sample service and compares the answers with the descriptions.

#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/SampleRoot.h"

#include <map>
#include <set>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

/// The keys of an answer by their paths ("configuration.cameras[].name"), each with the types of its values.
using Seen = std::map<std::string, std::set<Value::Type>>;

void collect(const Value& value, const std::string& path, Seen& seen) {
    if (!path.empty()) {
        seen[path].insert(value.type());
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        for (const DictionaryEntry& entry : *dictionary) {
            collect(entry.value, path.empty() ? entry.key : path + '.' + entry.key, seen);
        }
    } else if (const Array* array = value.array()) {
        for (const Value& element : *array) {
            collect(element, path + "[]", seen);
        }
    }
}

/// Returns true if a value of this type fits the type in an answer's description.
bool fits(Value::Type type, std::string_view described) {
    using T = Value::Type;
    static const std::map<std::string_view, std::set<T>> types{
        {"any", {T::null, T::boolean, T::integer, T::real, T::string, T::date, T::data, T::array, T::dictionary}},
        {"scalar", {T::boolean, T::integer, T::real, T::string, T::date}},
        {"text", {T::string}},
        {"integer", {T::integer}},
        {"real", {T::real, T::integer}},
        {"boolean", {T::boolean}},
        {"date", {T::date}},
        {"data", {T::data}},
        {"list", {T::array}},
        {"dictionary", {T::dictionary}}};
    const auto found = types.find(described);
    return found != types.end() && found->second.contains(type);
}

class DescribedAnswers : public testing::Test {
  protected:
    [[nodiscard]] test::DaemonProcess::Options options() const {
        test::DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        return options;
    }
    [[nodiscard]] static Value valueOf(const test::HttpReply& reply) {
        if (reply.body.empty()) {
            return {};  // the command returns no answer
        }
        const auto value = parseJson(reply.body);
        EXPECT_TRUE(value) << reply.body;
        return value ? *value : Value();
    }
    [[nodiscard]] Value answerOf(const std::string& command, const std::string& request) const {
        return valueOf(daemon.connect().post("/v1/lumio/" + command, request));
    }

    const test::SampleRoot root;
    const test::DaemonProcess daemon{options()};
};

TEST_F(DescribedAnswers, EveryReadingCommandAnswersWithTheKeysAndTypesOfItsDescription) {
    const Value described = valueOf(daemon.connect().get("/v1/lumio"));
    const Array* commands = described.array();
    ASSERT_NE(commands, nullptr);
    // The sample has a value for everything that is described while the service is running with an issue.
    root.write("/var/lumio/server/.lumioserverd_startup_status.plist",
               "<plist><dict><key>error</key><integer>7</integer></dict></plist>");
    ASSERT_EQ(daemon.connect().post("/v1/lumio/startService").status, 204);
    int compared = 0;
    for (const Value& command : *commands) {
        const std::string name(command.dictionary()->text("name"));
        if (command.dictionary()->text("access") != "read") {
            continue;
        }
        SCOPED_TRACE(name);
        ++compared;
        Seen seen;
        collect(answerOf(name, "{}"), "", seen);
        collect(answerOf(name, jsonOf(command.dictionary()->at("example.request"))), "", seen);
        for (const Value& key : *command.dictionary()->get("answer").array()) {
            const std::string path(key.dictionary()->text("path"));
            const auto found = seen.find(path);
            if (found == seen.end()) {
                ADD_FAILURE() << "the sample's answer does not have " << path;
                continue;
            }
            for (const Value::Type type : found->second) {
                EXPECT_TRUE(fits(type, key.dictionary()->text("type"))) << path << " is a " << nameOf(type);
            }
            seen.erase(found);
        }
        for (const auto& [path, types] : seen) {
            ADD_FAILURE() << path << " is not described";
        }
    }
    EXPECT_GT(compared, 0);
}

}  // namespace
}  // namespace adminhost
