#include "commands/CommandTable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Array;
using adminhost::Data;
using adminhost::Date;
using adminhost::Dictionary;
using adminhost::Finding;
using adminhost::Value;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

std::vector<Finding> checkList(const char* list, Array entries) {
    return lumio::checkRequest("writeSettings", {{"configuration", Dictionary{{list, std::move(entries)}}}});
}
std::vector<Finding> checkProperty(Dictionary entry) {
    return checkList("properties", {std::move(entry)});
}
std::vector<Finding> checkCamera(Dictionary entry) {
    return checkList("cameras", {std::move(entry)});
}
std::vector<Finding> checkWorkflow(Dictionary entry) {
    return checkList("workflows", {std::move(entry)});
}
std::vector<Finding> checkAccess(Dictionary entry) {
    return checkCamera({{"_id_", "A-1"}, {"allowedUsersAndGroups", Array{std::move(entry)}}});
}
std::vector<Finding> checkName(Value name) {
    return checkProperty({{"_newid_", true}, {"name", std::move(name)}});
}
std::vector<Finding> checkValue(Value value) {
    return checkProperty({{"_id_", 4}, {"value", std::move(value)}});
}

MATCHER_P(At, path, "") {
    return arg.keyPath == path;
}
MATCHER_P2(Says, path, rule, "") {
    return arg.keyPath == path && arg.rule.find(rule) != std::string::npos && !arg.advice.empty();
}
auto only(const char* path, const char* rule) {
    return ElementsAre(Says(std::string(path), std::string(rule)));
}

const char* const nameKey = "configuration.properties.0.name";
const char* const valueKey = "configuration.properties.0.value";
const char* const accessKey = "configuration.cameras.0.allowedUsersAndGroups.0";

// Types

TEST(CheckRequest, AnEmptyRequestPassesForEveryCommand) {
    for (const lumio::CommandDescription& command : lumio::commands()) {
        EXPECT_THAT(lumio::checkRequest(command.name, {}), IsEmpty()) << command.name;
    }
}

TEST(CheckRequest, ATextWhereADictionaryBelongsIsRefused) {
    EXPECT_THAT(lumio::checkRequest("readSettings", {{"optionalArguments", "getCameras"}}),
                only("optionalArguments", "must be a dictionary, not text"));
    EXPECT_THAT(lumio::checkRequest("writeSettings", {{"configuration", "x"}}),
                only("configuration", "must be a dictionary"));
}

TEST(CheckRequest, ATextWhereAListBelongsIsRefused) {
    EXPECT_THAT(lumio::checkRequest("writeSettings", {{"configuration", Dictionary{{"cameras", "all"}}}}),
                only("configuration.cameras", "must be a list"));
    EXPECT_THAT(lumio::checkRequest("getWorkflows", {{"optionalArguments", Dictionary{{"languages", "de"}}}}),
                only("optionalArguments.languages", "must be a list"));
}

TEST(CheckRequest, AnElementThatIsNotADictionaryIsNamedByItsIndex) {
    EXPECT_THAT(checkList("workflows", {Dictionary{}, "x", Array{}}),
                ElementsAre(At("configuration.workflows.1"), At("configuration.workflows.2")));
    EXPECT_THAT(checkCamera({{"allowedUsersAndGroups", Array{"anna"}}}), only(accessKey, "must be a dictionary"));
}

TEST(CheckRequest, AnElementOfTheLanguagesMustBeText) {
    EXPECT_THAT(
        lumio::checkRequest("getProperties", {{"optionalArguments", Dictionary{{"languages", Array{"de", 5}}}}}),
        only("optionalArguments.languages.1", "must be a text, not"));
}

TEST(CheckRequest, UnknownKeysPassWhateverTheyHold) {
    EXPECT_THAT(
        lumio::checkRequest("readSettings", {{"colour", Array{1}}, {"optionalArguments", Dictionary{{"x", "\""}}}}),
        IsEmpty());
    EXPECT_THAT(checkProperty({{"_id_", 1}, {"description", "say \"yes\"\n"}}), IsEmpty());
}

TEST(CheckRequest, ACommandWithoutKeysReadsNothingOfItsRequest) {
    EXPECT_THAT(lumio::checkRequest("getCameras", {{"optionalArguments", "text"}}), IsEmpty());
}

TEST(CheckRequest, AnUnknownCommandHasNothingToCheck) {
    EXPECT_THAT(lumio::checkRequest("formatDisk", {{"configuration", 5}}), IsEmpty());
}

TEST(CheckRequest, ASettingThatIsStoredAsItComesMayBeTextOrNumber) {
    for (const Value& port : {Value(8170), Value("8170"), Value("x"), Value(8170.5), Value(true)}) {
        EXPECT_THAT(lumio::checkRequest("writeSettings", {{"configuration", Dictionary{{"server_port", port}}}}),
                    IsEmpty());
    }
    EXPECT_THAT(lumio::checkRequest("writeSettings", {{"configuration", Dictionary{{"server_port", Array{1}}}}}),
                only("configuration.server_port", "must be a single value"));
}

TEST(CheckRequest, AVariantOfServiceControlMayBeAnything) {
    for (const char* command : {"getState", "startService", "stopService", "recycleService"}) {
        EXPECT_THAT(lumio::checkRequest(command, {{"variant", Array{1}}}), IsEmpty()) << command;
    }
}

TEST(CheckRequest, MissingKeysAreTheOperationsOwnMatter) {
    EXPECT_THAT(lumio::checkRequest("createNimboAccount", {{"directoryUsername", "a"}}), IsEmpty());
    EXPECT_THAT(lumio::checkRequest("createNimboAccount", {{"directoryNode", 1}}),
                only("directoryNode", "must be a text"));
}

TEST(CheckRequest, EveryFindingIsReported) {
    EXPECT_THAT(checkList("properties", {Dictionary{{"_newid_", true}, {"name", "a\"b\n"}, {"value", "rowid"}},
                                         Dictionary{{"_id_", "x"}, {"value", "c\"d"}}}),
                ElementsAre(At(nameKey), At(nameKey), At(valueKey), At("configuration.properties.1._id_"),
                            At("configuration.properties.1.value")));
}

// Properties

TEST(CheckProperties, ADoubleQuoteIsRefused) {
    EXPECT_THAT(checkName("x\", writefile(\"/etc/cron.d/x"), only(nameKey, "double quote"));
    EXPECT_THAT(checkValue("say \"yes\""), only(valueKey, "double quote"));
}

TEST(CheckProperties, ALineFeedIsRefusedInANameAndPassesInAValue) {
    EXPECT_THAT(checkName("a\nb"), only(nameKey, "line feed"));
    EXPECT_THAT(checkValue("last\n"), IsEmpty());
    EXPECT_THAT(checkValue("-----BEGIN\nid = 3\n\n   protect = t\n"), IsEmpty());
}

TEST(CheckProperties, AValueThatSpellsOutAWholeRowIsRefused) {
    const std::string row =
        "x\n   protect = f\ncreated_at = a\nupdated_at = b\n\n        id = 3\n      name = y\n     value = z";
    EXPECT_THAT(checkValue(row), only(valueKey, "as the database tool prints them"));
    EXPECT_THAT(checkValue(row.substr(0, row.find("     value"))), IsEmpty());
}

TEST(CheckProperties, ANulIsRefused) {
    EXPECT_THAT(checkName(std::string("a\0b", 3)), only(nameKey, "NUL"));
    EXPECT_THAT(checkValue(std::string(1, '\0')), only(valueKey, "NUL"));
}

TEST(CheckProperties, SingleQuotesBackslashesAndSeparatorsPass) {
    EXPECT_THAT(checkName("it's a \\ ; -- /* name"), IsEmpty());
    EXPECT_THAT(checkValue("a = b\tc\r; d 100% é"), IsEmpty());
    EXPECT_THAT(checkValue(""), IsEmpty());
    EXPECT_THAT(checkValue("-line"), IsEmpty()) << "a value stands inside a statement, so a hyphen does no harm";
}

TEST(CheckProperties, NamesOfColumnsAreRefusedInAnyCase) {
    for (const char* word : {"id", "name", "value", "protect", "created_at", "updated_at", "rowid", "oid", "_rowid_",
                             "NAME", "Value", "ROWID", "Oid", "_RowId_"}) {
        EXPECT_THAT(checkName(word), only(nameKey, "column")) << word;
        EXPECT_THAT(checkValue(word), only(valueKey, "column")) << word;
    }
}

TEST(CheckProperties, NamesThatOnlyHoldAColumnsNamePass) {
    for (const char* word : {"names", " name", "name ", "id.name", "recording_status", "_id_", "true", "null"}) {
        EXPECT_THAT(checkName(word), IsEmpty()) << word;
    }
}

TEST(CheckProperties, ARowNumberIsWholeAndDecimal) {
    for (const Value& id : {Value(4), Value("4"), Value("007"), Value("9223372036854775807"), Value(INT64_MAX)}) {
        EXPECT_THAT(checkProperty({{"_id_", id}, {"value", "x"}}), IsEmpty());
        EXPECT_THAT(checkProperty({{"_id_", id}, {"_obsoleteid_", true}}), IsEmpty());
    }
    for (const Value& id : {Value(-1), Value(1.5), Value(true), Value(Date{}), Value(""), Value("-1"), Value("+1"),
                            Value(" 1"), Value("1 or 1=1"), Value("0x10"), Value("1;"), Value("1e3"), Value("id"),
                            Value("(select 1)"), Value("12345678901234567890"), Value("\xD9\xA3")}) {
        EXPECT_THAT(checkProperty({{"_id_", id}, {"value", "x"}}),
                    only("configuration.properties.0._id_", "row number"));
        EXPECT_THAT(checkProperty({{"_id_", id}, {"_obsoleteid_", true}}),
                    only("configuration.properties.0._id_", "row number"));
    }
    EXPECT_THAT(checkProperty({{"_id_", Array{1}}}), only("configuration.properties.0._id_", "must be a single value"));
}

TEST(CheckProperties, AChangeWithoutRowNumberPassesBecauseItMatchesNoRow) {
    EXPECT_THAT(checkProperty({{"value", "x"}}), IsEmpty());
    EXPECT_THAT(checkProperty({{"_obsoleteid_", true}}), IsEmpty());
}

TEST(CheckProperties, TheRowNumberThatAnAdditionBringsStandsUnquotedInTheNameCheck) {
    EXPECT_THAT(checkProperty({{"_newid_", true}, {"name", "a"}, {"id", "1 or 1"}}),
                only("configuration.properties.0.id", "row number"));
    EXPECT_THAT(checkProperty({{"_newid_", true}, {"name", "a"}, {"id", 12}}), IsEmpty());
    EXPECT_THAT(checkProperty({{"_id_", 1}, {"name", "a"}, {"id", "1 or 1"}}), IsEmpty())
        << "a change takes it from the row";
}

TEST(CheckProperties, ARemovalLooksAtNothingButItsRowNumber) {
    EXPECT_THAT(checkProperty(
                    {{"_id_", 1}, {"_obsoleteid_", true}, {"name", "a\"b"}, {"value", Array{}}, {"protect", Array{}}}),
                IsEmpty());
}

TEST(CheckProperties, AnEntryWithBothFlagsIsARemoval) {
    EXPECT_THAT(checkProperty({{"_id_", 1}, {"_obsoleteid_", true}, {"_newid_", true}, {"name", "a\"b"}}), IsEmpty());
    EXPECT_THAT(checkProperty({{"_id_", "x"}, {"_obsoleteid_", true}, {"_newid_", true}}),
                only("configuration.properties.0._id_", "row number"));
}

TEST(CheckProperties, AnAdditionDoesNotReadTheIdentityKey) {
    EXPECT_THAT(checkProperty({{"_id_", "new-1"}, {"_newid_", true}, {"name", "a"}}), IsEmpty());
}

TEST(CheckProperties, FlagsAreReadAsTheOperationReadsThem) {
    const Dictionary entry = {{"_id_", 1}, {"name", "a\"b"}};
    for (const Value& flag : {Value(1), Value(0.5), Value("yes"), Value("true"), Value(" 01"), Value("T")}) {
        Dictionary removal = entry;
        removal.set("_obsoleteid_", flag);
        EXPECT_THAT(checkProperty(removal), IsEmpty());
    }
    for (const Value& flag : {Value(0), Value("no"), Value("00"), Value(""), Value("x1"), Value(false)}) {
        Dictionary change = entry;
        change.set("_obsoleteid_", flag);
        EXPECT_THAT(checkProperty(change), only(nameKey, "double quote"));
    }
    EXPECT_THAT(checkProperty({{"_obsoleteid_", Array{}}}),
                only("configuration.properties.0._obsoleteid_", "yes or no"));
}

TEST(CheckProperties, CreationAndChangeTimesAreReplacedAndSoNotLookedAt) {
    EXPECT_THAT(checkProperty({{"_newid_", true}, {"name", "a"}, {"created_at", "\""}, {"updated_at", "\n"}}),
                IsEmpty());
}

TEST(CheckProperties, NumbersDatesAndBooleansPassAsNameOrValue) {
    for (const Value& value : {Value(5), Value(-1.5), Value(true), Value(Date{})}) {
        EXPECT_THAT(checkName(value), IsEmpty());
        EXPECT_THAT(checkValue(value), IsEmpty());
    }
    for (const Value& value : {Value(Array{}), Value(Dictionary{}), Value(Data{1})}) {
        EXPECT_THAT(checkValue(value), only(valueKey, "must be a single value"));
    }
}

TEST(CheckProperties, TextsUpTo95KilobytesPass) {
    EXPECT_THAT(checkValue(std::string(95'000, 'x')), IsEmpty());
    EXPECT_THAT(checkValue(std::string(95'001, 'x')), only(valueKey, "95 kB"));
    EXPECT_THAT(checkName(std::string(95'001, 'x')), only(nameKey, "95 kB"));
}

TEST(CheckProperties, NameAndValueStandInOneArgumentAndCountTogether) {
    const auto check = [](std::size_t name, std::size_t value) {
        return checkProperty({{"_id_", 1}, {"name", std::string(name, 'n')}, {"value", std::string(value, 'v')}});
    };
    EXPECT_THAT(check(45'000, 50'000), IsEmpty());
    EXPECT_THAT(check(45'001, 50'000), only("configuration.properties.0", "name and value together"));
    EXPECT_THAT(check(1, 95'001), only(valueKey, "95 kB")) << "said once";
}

TEST(CheckProperties, ProtectIsABooleanNumberOrText) {
    for (const Value& protect : {Value(true), Value(0), Value("t"), Value("no")}) {
        EXPECT_THAT(checkProperty({{"_id_", 1}, {"protect", protect}}), IsEmpty());
    }
    EXPECT_THAT(checkProperty({{"_id_", 1}, {"protect", Array{}}}),
                only("configuration.properties.0.protect", "yes or no"));
}

// Cameras and workflows

TEST(CheckResources, AnIdentifierHasLettersDigitsAndHyphens) {
    for (const char* id : {"0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01", "abc", "7", "a-"}) {
        EXPECT_THAT(checkCamera({{"_id_", id}, {"access_control_enabled", true}}), IsEmpty()) << id;
        EXPECT_THAT(checkWorkflow({{"_id_", id}, {"access_control_enabled", true}}), IsEmpty()) << id;
    }
    for (const char* id : {"", "-a", "a b", "a\"b", "a'b", "a_b", "{a}", "a\n", "\xC3\xA9"}) {
        EXPECT_THAT(checkCamera({{"_id_", id}, {"access_control_enabled", true}}),
                    only("configuration.cameras.0._id_", "identifier"))
            << id;
        EXPECT_THAT(checkWorkflow({{"_id_", id}, {"access_control_enabled", true}}),
                    only("configuration.workflows.0._id_", "identifier"))
            << id;
    }
    EXPECT_THAT(checkCamera({{"_id_", std::string("a\0b", 3)}, {"_obsoleteid_", true}}), SizeIs(1));
    EXPECT_THAT(checkCamera({{"_id_", 5}, {"_obsoleteid_", true}}),
                only("configuration.cameras.0._id_", "must be a text"));
}

TEST(CheckResources, AnIdentifierThatNamesAColumnWouldMatchEveryRow) {
    for (const char* id : {"uuid", "UUID", "id", "rowid", "oid", "disabled", "name"}) {
        EXPECT_THAT(checkCamera({{"_id_", id}, {"access_control_enabled", true}}),
                    only("configuration.cameras.0._id_", "column"))
            << id;
        EXPECT_THAT(checkWorkflow({{"_id_", id}, {"access_control_enabled", false}}),
                    only("configuration.workflows.0._id_", "column"))
            << id;
    }
}

TEST(CheckResources, AnIdentifierLongerThanAnArgumentIsRefused) {
    EXPECT_THAT(checkCamera({{"_id_", std::string(95'001, 'a')}, {"_obsoleteid_", true}}),
                only("configuration.cameras.0._id_", "95 kB"));
}

TEST(CheckResources, AnEntryThatChangesNothingIsNotLookedAt) {
    EXPECT_THAT(checkCamera({{"_id_", "a\"b"}, {"name", "x\"y"}}), IsEmpty());
    EXPECT_THAT(checkCamera({{"_id_", "a\"b"}, {"allowedUsersAndGroups", Array{}}}), IsEmpty());
    EXPECT_THAT(checkWorkflow({{"_id_", "a\"b"}, {"_obsoleteid_", true}}), IsEmpty()) << "workflows are not removed";
}

TEST(CheckResources, TheIdentifierOfARemovedCameraIsLookedAt) {
    EXPECT_THAT(checkCamera({{"_id_", "--help"}, {"_obsoleteid_", true}}),
                only("configuration.cameras.0._id_", "identifier"));
    EXPECT_THAT(checkCamera({{"_id_", "--help"}, {"_obsoleteid_", "01"}}),
                only("configuration.cameras.0._id_", "identifier"));
}

TEST(CheckResources, ARemovedCamerasOtherKeysAreNotLookedAt) {
    EXPECT_THAT(checkCamera({{"_id_", "a"},
                             {"_obsoleteid_", true},
                             {"access_control_enabled", Array{}},
                             {"allowedUsersAndGroups", "text"}}),
                IsEmpty());
}

TEST(CheckResources, TheAccessSwitchIsABooleanNumberOrText) {
    EXPECT_THAT(checkCamera({{"_id_", "a"}, {"access_control_enabled", "f"}}), IsEmpty());
    EXPECT_THAT(checkCamera({{"_id_", "a"}, {"access_control_enabled", Dictionary{}}}),
                only("configuration.cameras.0.access_control_enabled", "yes or no"));
}

// Access lists

TEST(CheckAccess, AShortNameBeginningWithAHyphenIsRefused) {
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", "--remove_camera"}}),
                only("configuration.cameras.0.allowedUsersAndGroups.0.shortName", "hyphen"));
    EXPECT_THAT(checkWorkflow({{"_id_", "a"},
                               {"allowedUsersAndGroups",
                                Array{Dictionary{{"_newid_", "yes"}, {"type", "GROUP"}, {"shortName", "-"}}}}}),
                only("configuration.workflows.0.allowedUsersAndGroups.0.shortName", "hyphen"));
}

TEST(CheckAccess, AShortNameWithANulOrOfMoreThan95KilobytesIsRefused) {
    const std::string path = std::string(accessKey) + ".shortName";
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", std::string("a\0", 2)}}),
                only(path.c_str(), "NUL"));
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", std::string(95'001, 'a')}}),
                only(path.c_str(), "95 kB"));
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", 7}}),
                only(path.c_str(), "must be a text"));
}

TEST(CheckAccess, AnArgumentCarriesQuotesBlanksAndLineFeeds) {
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", "a \"b\"\nc"}}), IsEmpty());
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}, {"shortName", "name"}}), IsEmpty());
}

TEST(CheckAccess, AnAdditionOfAnUnknownKindDoesNothingAndIsNotLookedAt) {
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "robot"}, {"shortName", "-x"}}), IsEmpty());
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"shortName", "-x"}, {"_obsoleteid_", true}, {"_id_", "\""}}),
                IsEmpty());
}

TEST(CheckAccess, AnAdditionWithoutShortNameIsTheOperationsOwnMatter) {
    EXPECT_THAT(checkAccess({{"_newid_", true}, {"type", "user"}}), IsEmpty());
}

TEST(CheckAccess, AnEntryWithoutFlagsIsNotLookedAt) {
    EXPECT_THAT(checkAccess({{"type", "user"}, {"shortName", "-x"}, {"_id_", "\""}}), IsEmpty());
}

TEST(CheckAccess, AnEntryWithBothFlagsIsAnAddition) {
    EXPECT_THAT(
        checkAccess(
            {{"_newid_", true}, {"_obsoleteid_", true}, {"type", "user"}, {"shortName", "anna"}, {"_id_", "\""}}),
        IsEmpty());
}

TEST(CheckAccess, ARemovalLooksAtTheIdentifierOnly) {
    EXPECT_THAT(
        checkAccess({{"_obsoleteid_", true}, {"_id_", "5B1C8A54-1A43-5C55-8E0C-6B0C8A1F3D11"}, {"shortName", "-x"}}),
        IsEmpty());
    EXPECT_THAT(checkAccess({{"_obsoleteid_", true}, {"_id_", "not a uuid"}}),
                only("configuration.cameras.0.allowedUsersAndGroups.0._id_", "identifier"));
}

TEST(CheckAccess, FlagsOfAccessEntriesAreReadWithoutSkippingZeros) {
    EXPECT_THAT(checkAccess({{"_newid_", "01"}, {"type", "user"}, {"shortName", "-x"}}), IsEmpty());
    EXPECT_THAT(checkAccess({{"_newid_", " 1"}, {"type", "user"}, {"shortName", "-x"}}), SizeIs(1));
}

TEST(CheckAccess, MoreNamesThanTheArgumentsOfOneToolCanCarryAreRefused) {
    Array many(20, Dictionary{{"_newid_", true}, {"type", "user"}, {"shortName", std::string(80'000, 'a')}});
    EXPECT_THAT(checkCamera({{"_id_", "a"}, {"allowedUsersAndGroups", many}}),
                only("configuration.cameras.0.allowedUsersAndGroups", "arguments of one tool"));
    many.resize(18);
    EXPECT_THAT(checkCamera({{"_id_", "a"}, {"allowedUsersAndGroups", many}}), IsEmpty());
}

// Values that other commands pass to tools

TEST(CheckArguments, AControllerMustFitTheGridToolsArgument) {
    EXPECT_THAT(lumio::checkRequest("validateSettings", {{"nimbo_controller", "-grid"}}),
                only("nimbo_controller", "hyphen"));
    EXPECT_THAT(lumio::checkRequest("writeSettings",
                                    {{"configuration", Dictionary{{"nimbo_controller", std::string(1, '\0')}}}}),
                only("configuration.nimbo_controller", "NUL"));
    EXPECT_THAT(lumio::checkRequest("validateSettings", {{"nimbo_controller", "grid.example.com"}}), IsEmpty());
}

std::vector<std::string> unknownIn(Dictionary configuration) {
    return lumio::unknownKeys("writeSettings", {{"configuration", std::move(configuration)}, {"other", 1}});
}

TEST(UnknownKeys, OfAConfigurationAreNamedByTheirKeyPaths) {
    EXPECT_THAT(unknownIn({{"server_port", 4}, {"server_prot", 5}, {"cameras", Array{}}}),
                ElementsAre("configuration.server_prot"));
    EXPECT_THAT(
        unknownIn(
            {{"cameras",
              Array{Dictionary{{"_id_", "A"}},
                    Dictionary{{"_id_", "B"},
                               {"acces_control_enabled", true},
                               {"allowedUsersAndGroups",
                                Array{Dictionary{{"_newid_", true}, {"type", "user"}, {"shortname", "anna"}}}}}}}}),
        ElementsAre("configuration.cameras.1.acces_control_enabled",
                    "configuration.cameras.1.allowedUsersAndGroups.0.shortname"));
}

TEST(UnknownKeys, AreNotThoseThatReadingReturns) {
    EXPECT_THAT(unknownIn({{"cameras", Array{Dictionary{{"_id_", "A"}, {"name", "Studio"}, {"created_at", "x"}}}}}),
                IsEmpty());
}

TEST(UnknownKeys, AreNotLookedForInEntriesThatChangeNothing) {
    EXPECT_THAT(
        unknownIn({{"cameras", Array{Dictionary{{"_id_", "A"},
                                                {"allowedUsersAndGroups", Array{Dictionary{{"longName", "Anna"}}}}}}}}),
        IsEmpty());
}

TEST(UnknownKeys, AreNoneWithoutAConfiguration) {
    EXPECT_THAT(lumio::unknownKeys("writeSettings", {{"other", 1}}), IsEmpty());
    EXPECT_THAT(lumio::unknownKeys("fly", {{"configuration", Dictionary{{"a", 1}}}}), IsEmpty());
}

TEST(CheckSettings, SharedFilesystemMustBeAnAbsolutePath) {
    const auto written = [](const char* path) {
        return lumio::checkRequest("writeSettings",
                                   {{"configuration", Dictionary{{"shared_filesystem", Value(path)}}}});
    };
    EXPECT_THAT(written("/srv/media"), IsEmpty());
    for (const char* path : {"srv/media", "./media", "../media", "", " /srv"}) {
        EXPECT_THAT(written(path), only("configuration.shared_filesystem", "must be an absolute path")) << path;
        EXPECT_THAT(lumio::checkRequest("validateSettings", {{"shared_filesystem", Value(path)}}),
                    only("shared_filesystem", "must be an absolute path"));
    }
    EXPECT_THAT(lumio::checkRequest("writeSettings",
                                    {{"configuration", Dictionary{{"shared_filesystem", std::string("/a\0b", 4)}}}}),
                only("configuration.shared_filesystem", "NUL"));
}

}  // namespace
