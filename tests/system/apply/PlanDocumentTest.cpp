// The document that plan and apply print for programs, compared with its table in the documentation.

#include "platform/json/Json.h"
#include "tests/system/apply/ControlledService.h"

#include <set>

namespace adminhost::test {
namespace {

using testing::IsSupersetOf;

/// The keys of the document, by the table of the documentation.
struct Documented {
    std::set<std::string> all;
    std::set<std::string> always;
};

class PlanDocument : public ControlledService {
  protected:
    /// The keys with this prefix, without it.
    [[nodiscard]] static Documented documented(const std::string& prefix) {
        const std::string text = read(SOURCE_DIR "/docs/adminhostctl.md");
        const std::size_t begin = text.find("\n### Plans and outcomes for programs\n");
        EXPECT_NE(begin, std::string::npos);
        std::istringstream lines(text.substr(begin, text.find("\n## ", begin) - begin));
        Documented keys;
        for (std::string line; std::getline(lines, line);) {
            const std::size_t end = line.find("` | ", 3);
            if (!line.starts_with("| `" + prefix) || end == std::string::npos) {
                continue;
            }
            const std::string key = line.substr(3 + prefix.size(), end - 3 - prefix.size());
            if (key.find("[]") == std::string::npos) {
                keys.all.insert(key);
                if (line.compare(end + 4, 8, "always |") == 0) {
                    keys.always.insert(key);
                }
            }
        }
        return keys;
    }
    [[nodiscard]] static std::set<std::string> keysOf(const Dictionary& dictionary) {
        std::set<std::string> keys;
        for (const DictionaryEntry& entry : dictionary) {
            keys.insert(entry.key);
        }
        return keys;
    }
    /// Checks one document and adds the keys of its changes.
    void addChanges(const ProgramResult& result, std::set<std::string>& keys) const {
        const auto document =
            parseJson(result.output.substr(std::min(result.output.find("{\n"), result.output.size())));
        ASSERT_TRUE(document && document->dictionary() != nullptr) << result.output;
        EXPECT_EQ(keysOf(*document->dictionary()), documented("").all);
        const Array* changes = document->dictionary()->get("changes").array();
        ASSERT_NE(changes, nullptr);
        EXPECT_FALSE(changes->empty());
        const Documented known = documented("changes[].");
        for (const Value& change : *changes) {
            const std::set<std::string> present = keysOf(*change.dictionary());
            EXPECT_THAT(known.all, IsSupersetOf(present));
            EXPECT_THAT(present, IsSupersetOf(known.always));
            keys.insert(present.begin(), present.end());
        }
    }
    [[nodiscard]] ProgramResult json(std::vector<std::string> words) const {
        words.insert(words.begin(),
                     {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket(), "--format", "json"});
        return runProgram(words);
    }
};

TEST_F(PlanDocument, HasTheKeysOfItsDocumentationAndNoOthers) {
    EXPECT_EQ(documented("").always, (std::set<std::string>{"changes", "notes", "restart"}));
    const std::string desired =
        file("desired.toml",
             "[remove_unlisted]\naccess = true\n[settings]\nserver_port = 8180\nnimbo_client_username = \"other\"\n"
             "[properties.default_language]\nvalue = \"fr\"\n[properties.fresh]\nvalue = \"x\"\nprotect = true\n"
             "[cameras.\"Main hall\"]\nusers = [\"ben\"]\n");
    std::set<std::string> planned;
    addChanges(json({"plan", desired}), planned);
    EXPECT_FALSE(planned.contains("applied"));
    EXPECT_FALSE(planned.contains("reason"));
    root.setSwitch("lumioconfig.exit", "3");
    std::set<std::string> applied;
    addChanges(json({"apply", desired}), applied);
    EXPECT_EQ(applied, documented("changes[].").all) << "each of them occurs";
    planned.insert({"applied", "reason"});
    EXPECT_EQ(planned, applied);
}

}  // namespace
}  // namespace adminhost::test
