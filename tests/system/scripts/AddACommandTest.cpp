// Adds a command to a copy of the tree as docs/add-a-command.md describes, and compares the changed files with its
// table.

#include "tests/support/Program.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

using adminhost::test::Errors;
using adminhost::test::runProgram;
namespace fs = std::filesystem;

constexpr const char* command = "countCameras";
constexpr const char* group = "ResourceRequests";

std::string contentsOf(const fs::path& file) {
    std::ifstream stream(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
}

class AddACommand : public testing::Test {
  protected:
    void SetUp() override {
        std::string pattern = (fs::temp_directory_path() / "command-XXXXXX").string();
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        tree = pattern;
        for (const char* folder : folders) {
            fs::copy(fs::path(SOURCE_DIR) / folder, tree / folder, fs::copy_options::recursive);
        }
        fs::create_directories(tree / "tests/unit");
        fs::copy(fs::path(SOURCE_DIR) / "tests/unit/handler", tree / "tests/unit/handler", fs::copy_options::recursive);
    }
    void TearDown() override { fs::remove_all(tree); }

    void write(const std::string& file, const std::string& text) const { std::ofstream(tree / file) << text; }
    /// Inserts a text before the first occurrence of another one.
    void insert(const std::string& file, const std::string& text, const std::string& before) const {
        std::string content = contentsOf(tree / file);
        const std::size_t at = content.find(before);
        ASSERT_NE(at, std::string::npos) << file << " has no " << before;
        write(file, content.insert(at, text));
    }
    void expectSuccess(const std::vector<std::string>& program) const {
        const auto result = runProgram(program, Errors::merge);
        EXPECT_EQ(result.status, 0) << result.output;
    }
    /// The files of the copy that are missing from the tree or differ from it.
    [[nodiscard]] std::set<std::string> touched() const {
        std::set<std::string> files;
        for (const auto& entry : fs::recursive_directory_iterator(tree)) {
            const std::string name = fs::relative(entry.path(), tree);
            if (entry.is_regular_file() && contentsOf(entry.path()) != contentsOf(fs::path(SOURCE_DIR) / name)) {
                files.insert(name);
            }
        }
        return files;
    }
    /// The first column of the guide's table, with the names of this command inserted.
    [[nodiscard]] static std::set<std::string> namedByTheGuide() {
        std::ifstream guide(std::string(SOURCE_DIR) + "/docs/add-a-command.md");
        std::set<std::string> places;
        for (std::string line; std::getline(guide, line) && line.rfind("## ", 0) != 0;) {
            if (line.rfind("| `", 0) != 0) {
                continue;
            }
            std::string place = line.substr(3, line.find('`', 3) - 3);
            for (const auto& [word, meaning] : {std::pair{"NAME", command}, {"GROUP", group}}) {
                if (const std::size_t at = place.find(word); at != std::string::npos) {
                    place.replace(at, std::string(word).size(), meaning);
                }
            }
            places.insert(place);
        }
        return places;
    }

    static constexpr const char* folders[] = {"commands", "handler", "plugin",   "resources", "settings",
                                              "codec",    "krb5",    "platform", "docs",      "scripts"};
    fs::path tree;
};

TEST_F(AddACommand, TouchesExactlyThePlacesThatTheGuideNames) {
    const std::string generator = (tree / "commands/generate.py").string();
    const std::string table = (tree / "CommandTable.cpp").string();
    write("commands/countCameras.toml", R"(order = 1000
summary = "Count the cameras"
access = "read"
needs = ["database"]

[answer.cameras]
type = "integer"
help = "How many there are."

[example]
request = '{}'
answer = '{"cameras": 12}'
)");
    insert("handler/LumioRequestHandler.h",
           "    [[nodiscard]] Response countCamerasWithRequest(const Dictionary& request);\n",
           "    [[nodiscard]] Response getCamerasWithRequest(");
    insert("handler/ResourceRequests.cpp",
           "Response LumioRequestHandler::countCamerasWithRequest(const Dictionary&) {\n"
           "    return Dictionary{{\"cameras\", 12}};\n}\n\n",
           "Response LumioRequestHandler::getCamerasWithRequest(");
    insert("plugin/Plugin.cpp",
           "    {\"countCameras\", [](LumioRequestHandler& h, const Dictionary& r) { return "
           "h.countCamerasWithRequest(r); }},\n",
           "    {\"getCameras\", ");
    write("tests/unit/handler/countCamerasTest.cpp", "#include \"handler/LumioRequestHandler.h\"\n");
    expectSuccess({"/usr/bin/python3", "-B", generator, "docs", (tree / "docs/commands.md").string()});

    expectSuccess({"/usr/bin/python3", "-B", generator, "table", table});
    EXPECT_NE(contentsOf(table).find("\"countCameras\""), std::string::npos);
    fs::remove(table);
    expectSuccess({"/usr/bin/python3", "-B", (tree / "scripts/include_edges.py").string(), tree.string()});
    for (const char* source : {"plugin/Plugin.cpp", "handler/ResourceRequests.cpp"}) {
        expectSuccess({"/usr/bin/c++", "-std=c++20", "-fsyntax-only", "-I" + tree.string(),
                       "-I" BINARY_DIR "/generated", (tree / source).string()});
    }
    EXPECT_EQ(touched(), namedByTheGuide());
}

}  // namespace
