#include "platform/bundle/Bundle.h"

#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

using Languages = std::vector<std::string>;

class BundleTest : public testing::Test {
  protected:
    void SetUp() override {
        std::string pattern = testing::TempDir() + "bundle.XXXXXX";
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        _directory = pattern;
    }
    void TearDown() override { std::filesystem::remove_all(_directory); }

    void write(const std::string& path, const std::string& content) {
        const std::filesystem::path file = _directory / path;
        std::filesystem::create_directories(file.parent_path());
        std::ofstream(file, std::ios::binary) << content;
    }
    /// A table that maps "Name" to the given text.
    void table(const std::string& path, const std::string& name) { write(path, "\"Name\" = \"" + name + "\";\n"); }

    [[nodiscard]] Bundle bundle() const { return Bundle::open(HostPath(_directory.string())).value(); }
    /// The table's "Name" in the languages, or "(null)".
    [[nodiscard]] std::string nameIn(const Languages& languages) const {
        const auto found = localizedTable(bundle(), "InfoPlist", languages);
        return found && found->contains("Name") ? *found->get("Name").string() : "(null)";
    }

    std::filesystem::path _directory;
};

TEST_F(BundleTest, OnlyAnExistingDirectoryOpens) {
    write("file", "");
    EXPECT_TRUE(Bundle::open(HostPath(_directory.string())));
    EXPECT_FALSE(Bundle::open(HostPath((_directory / "file").string())));
    EXPECT_FALSE(Bundle::open(HostPath((_directory / "missing").string())));
    EXPECT_FALSE(Bundle::open(HostPath("")));
    EXPECT_EQ(bundle().path().text(), _directory.string());
}

TEST_F(BundleTest, LiesBelowTheSystemRoot) {
    table("System/x.bundle/en/InfoPlist.strings", "english");
    setSystemRoot(_directory.string());
    const auto opened = Bundle::open(HostPath("/System/x.bundle"));
    const auto found = opened ? localizedTable(*opened, "InfoPlist", {}) : std::nullopt;
    setSystemRoot("/");
    ASSERT_TRUE(opened);
    EXPECT_EQ(opened->path().text(), "/System/x.bundle");
    EXPECT_TRUE(found);
}

TEST_F(BundleTest, LocalizationsAreTheLanguageDirectoriesOfAllThreePlaces) {
    table("Contents/Resources/French.lproj/InfoPlist.strings", "f");
    table("Resources/de/InfoPlist.strings", "d");
    table("pt_BR.texts/InfoPlist.strings", "p");
    table("Contents/Resources/images/InfoPlist.strings", "none");
    write("Contents/Resources/es", "a file");
    EXPECT_EQ(bundle().localizations(), (Languages{"French", "de", "pt_BR"}));
    EXPECT_EQ(nameIn({"fr"}), "f");
    EXPECT_EQ(nameIn({"German"}), "d");
    EXPECT_EQ(nameIn({"pt-BR"}), "p");
}

TEST_F(BundleTest, LocalizationInTwoPlacesIsListedOnceAndLookedIntoInOrder) {
    table("Contents/Resources/de.lproj/InfoPlist.strings", "first");
    table("de.lproj/InfoPlist.strings", "second");
    table("de.lproj/Other.strings", "other");
    EXPECT_EQ(bundle().localizations(), Languages{"de"});
    EXPECT_EQ(nameIn({"de"}), "first");
    EXPECT_TRUE(localizedTable(bundle(), "Other", {"de"}));
}

TEST_F(BundleTest, GermanIsShownToFrenchThenGermanAndEnglishWhereThereIsNothingElse) {
    table("Contents/Resources/German.lproj/InfoPlist.strings", "deutsch");
    table("Contents/Resources/English.lproj/InfoPlist.strings", "english");
    EXPECT_EQ(nameIn({"French", "German"}), "deutsch");
    EXPECT_EQ(nameIn({"fr", "de"}), "deutsch");
    std::filesystem::remove_all(_directory / "Contents/Resources/German.lproj");
    EXPECT_EQ(nameIn({"French", "German"}), "english");
    EXPECT_EQ(nameIn({}), "english");
}

TEST_F(BundleTest, MatchingLocalizationWithoutTheTableIsPassedOver) {
    table("fr.lproj/Other.strings", "wrong table");
    table("de.lproj/InfoPlist.strings", "deutsch");
    table("fr-CA.lproj/Other.strings", "wrong table");
    EXPECT_EQ(nameIn({"fr-CA", "fr", "de"}), "deutsch");
}

TEST_F(BundleTest, RegionalLocalizationWithoutTheTableFallsBackToThePlainLanguage) {
    table("fr-CA.lproj/Other.strings", "wrong table");
    table("fr.lproj/InfoPlist.strings", "french");
    table("en.lproj/InfoPlist.strings", "english");
    EXPECT_EQ(nameIn({"fr-CA"}), "french");
}

TEST_F(BundleTest, FirstTableFoundIsAnsweredEvenIfItCannotBeRead) {
    write("fr.lproj/InfoPlist.strings", "\"Name\" = ");
    table("de.lproj/InfoPlist.strings", "deutsch");
    table("en.lproj/InfoPlist.strings", "english");
    EXPECT_EQ(localizedTable(bundle(), "InfoPlist", {"fr", "de"}), std::nullopt);
    write("en.lproj/InfoPlist.strings", "broken");
    EXPECT_EQ(localizedTable(bundle(), "InfoPlist", {"it"}), std::nullopt);
}

TEST_F(BundleTest, WithoutAMatchEnglishIsAnsweredUnderEitherSpelling) {
    table("en.lproj/InfoPlist.strings", "code");
    EXPECT_EQ(nameIn({"it"}), "code");
    table("English.lproj/InfoPlist.strings", "name");
    EXPECT_EQ(nameIn({"it"}), "name");
    EXPECT_EQ(nameIn({"en"}), "code");
}

TEST_F(BundleTest, WithoutAMatchAndWithoutEnglishThereIsNothing) {
    table("de.lproj/InfoPlist.strings", "deutsch");
    EXPECT_EQ(nameIn({"fr"}), "(null)");
    EXPECT_EQ(localizedTable(bundle(), "NoSuchTable", {"de"}), std::nullopt);
}

TEST_F(BundleTest, CatalanIsNotAnsweredInSpanish) {
    table("es.lproj/InfoPlist.strings", "spanish");
    table("en.lproj/InfoPlist.strings", "english");
    EXPECT_EQ(nameIn({"ca"}), "english");
}

TEST_F(BundleTest, PipesAndDirectoriesInAPlaceOfATableAreReadAsNothing) {
    std::filesystem::create_directories(_directory / "fr.lproj/Table.strings");
    std::filesystem::create_directories(_directory / "de.lproj");
    ASSERT_EQ(::mkfifo((_directory / "de.lproj/Table.strings").c_str(), 0600), 0);
    ASSERT_EQ(::mkfifo((_directory / "it").c_str(), 0600), 0);
    EXPECT_EQ(localizedTable(bundle(), "Table", {"fr"}), std::nullopt);
    EXPECT_EQ(localizedTable(bundle(), "Table", {"de"}), std::nullopt);
    EXPECT_EQ(bundle().localizations(), (Languages{"de", "fr"}));
}

TEST_F(BundleTest, LinksAreFollowedAndDanglingOrCircularOnesAreNoLocalizations) {
    table("texts/InfoPlist.strings", "linked");
    std::filesystem::create_directory_symlink(_directory / "texts", _directory / "de.lproj");
    std::filesystem::create_symlink("nowhere", _directory / "fr.lproj");
    std::filesystem::create_symlink("es.lproj", _directory / "es.lproj");
    EXPECT_EQ(bundle().localizations(), Languages{"de"});
    EXPECT_EQ(nameIn({"de"}), "linked");
}

TEST_F(BundleTest, TableLargerThanTheBoundIsReadAsNothing) {
    table("de.lproj/InfoPlist.strings", "deutsch");
    std::filesystem::resize_file(_directory / "de.lproj/InfoPlist.strings", stringsTableMaximumSize + 1);
    EXPECT_EQ(nameIn({"de"}), "(null)");
}

TEST_F(BundleTest, TablesOfAllFormsAreRead) {
    write("en.lproj/InfoPlist.strings",
          "<plist version=\"1.0\"><dict><key>Name</key><string>xml</string></dict></plist>");
    EXPECT_EQ(nameIn({}), "xml");
    write("en.lproj/InfoPlist.strings", std::string("\xFF\xFEN\0a\0m\0e\0=\0u\0;\0", 16));
    EXPECT_EQ(nameIn({}), "u");
    const auto missing = readStringsTable(DiskPath((_directory / "missing").string()));
    ASSERT_FALSE(missing);
    EXPECT_EQ(missing.error().domain, "posix");
}

}  // namespace
}  // namespace adminhost
