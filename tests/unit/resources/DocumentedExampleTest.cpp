#include "tests/unit/resources/PropertyFixture.h"

#include <fstream>
#include <iterator>

namespace lumio {
namespace {

/// The example in docs/protected-values.md, exactly as it is there.
class DocumentedExample : public PropertyFixture {
  protected:
    void SetUp() override {
        PropertyFixture::SetUp();
        std::ifstream file(SOURCE_DIR "/docs/protected-values.md");
        _text.assign(std::istreambuf_iterator<char>(file), {});
        ASSERT_FALSE(_text.empty());
    }

    /// The n-th block of that language.
    [[nodiscard]] std::string block(const std::string& language, int n = 0) const {
        const std::string begin = "```" + language + "\n";
        std::size_t at = _text.find(begin);
        for (; n > 0 && at != std::string::npos; --n) {
            at = _text.find(begin, at + 1);
        }
        if (at == std::string::npos) {
            ADD_FAILURE() << "no block of " << language;
            return {};
        }
        at += begin.size();
        return _text.substr(at, _text.find("```", at) - at);
    }

    [[nodiscard]] static std::string outputOf(const std::string& commands) {
        return adminhost::test::runProgram({"sh", "-c", commands}).output;
    }

    std::string _text;
};

TEST_F(DocumentedExample, OpensslMakesTheStoredFormAndReadsIt) {
    EXPECT_EQ(outputOf(block("sh", 0)), block("text"));
    EXPECT_EQ(outputOf(block("sh", 1)), "open sesame");
}

TEST_F(DocumentedExample, PropertiesHaveTheSameForm) {
    root.writePropertyList(keyPath, block("xml"));
    EXPECT_EQ(*Property::encryptValue("open sesame") + "\n", block("text"));
    std::string stored = block("text");
    stored.pop_back();
    EXPECT_EQ(Property::decryptValue(stored), "open sesame");
}

}  // namespace
}  // namespace lumio
