#include "handler/LumioRequestHandler.h"
#include "platform/value/ValueText.h"
#include "tests/unit/resources/PropertyFixture.h"

namespace lumio {
namespace {

using adminhost::Array;
using adminhost::Response;

constexpr const char* localizations =
    "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle/Contents/Resources/";

class PropertyRequests : public PropertyFixture {
  protected:
    void process(const Dictionary& entry) {
        const Array changes{entry};
        EXPECT_EQ(handler.processPropertyChangesWithRequest(&changes).kind(), Response::Kind::nothing);
    }
    Dictionary configuration(std::string_view variant) {
        const Response response =
            handler.readSettingsWithRequest({{"optionalArguments", Dictionary{{"variant", variant}}}});
        return *response.dictionary().get("configuration").dictionary();
    }
    void useClusterPreferences(const std::string& content) const {
        root.writePropertyList("/shared/Server/cluster_preferences.plist", content);
    }
    [[nodiscard]] Value passwordFlag() {
        Dictionary config;
        handler.copyClusterPreferencesToConfig(config);
        return config.get("nimbo_client_password_is_set");
    }

    LumioRequestHandler handler;
};

TEST_F(PropertyRequests, ListHasCommandListAndStatusZero) {
    sql("insert into properties(id,name,value,protect) values(1,'a','v','f'),(2,'b','aGlkZGVu','t')");
    const Response response = handler.getPropertiesWithRequest({});
    EXPECT_EQ(response.dictionary().size(), 3U);
    EXPECT_EQ(response.dictionary().get("command"), Value("getProperties"));
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
    const Array* list = response.dictionary().get("properties").array();
    ASSERT_NE(list, nullptr);
    ASSERT_EQ(list->size(), 2U);
    EXPECT_EQ((*list)[0].dictionary()->get("value"), Value("v"));
    EXPECT_FALSE((*list)[1].dictionary()->contains("value"));
}

TEST_F(PropertyRequests, ListThatFailsAnswersOnlyTheErrorsCode) {
    root.write(databasePath, "not a database, but long enough to be looked at: " + std::string(200, 'x'));
    EXPECT_EQ(handler.getPropertiesWithRequest({}).dictionary(), (Dictionary{{"readStatus", 26}}));
}

TEST_F(PropertyRequests, LanguagesComeFromTheRequestAndElseFromTheHost) {
    sql("insert into properties(id,name) values(1,'n')");
    root.write(std::string(localizations) + "en.lproj/PropertyDescriptions.strings", "n = number;");
    root.write(std::string(localizations) + "de.lproj/PropertyDescriptions.strings", "n = Nummer;");
    root.write(std::string(localizations) + "fr.lproj/PropertyDescriptions.strings", "n = nombre;");
    const auto description = [&](const Dictionary& request) {
        const Response response = handler.getPropertiesWithRequest(request);
        return textOf((*response.dictionary().get("properties").array())[0].dictionary()->get("description"));
    };
    EXPECT_EQ(description({}), "number");
    adminhost::setUserDefault("BrennLanguages", Array{"de_DE", "fr"});
    EXPECT_EQ(description({}), "Nummer");
    EXPECT_EQ(description({{"optionalArguments", Dictionary{{"languages", Array{"French", "de"}}}}}), "nombre");
    EXPECT_EQ(description({{"optionalArguments", Dictionary{{"languages", Array{}}}}}), "number");
    adminhost::setUserDefault("BrennLanguages", {});
    // Reading the settings passes its whole request on.
    const Response read = handler.readSettingsWithRequest(
        {{"optionalArguments", Dictionary{{"variant", "getProperties"}, {"languages", Array{"fr"}}}}});
    const Array& list = *read.dictionary().at("configuration.properties").array();
    EXPECT_EQ(list[0].dictionary()->get("description"), Value("nombre"));
}

TEST_F(PropertyRequests, ObsoleteEntryIsDeletedAlsoWhenItIsMarkedNew) {
    sql("insert into properties(id,name) values(1,'a'),(2,'b')");
    process({{"_id_", "1"}, {"_obsoleteid_", true}});
    process({{"_id_", 2}, {"_obsoleteid_", "yes"}, {"_newid_", true}, {"name", "c"}});
    EXPECT_EQ(sql("select count(*) from properties"), "0\n");
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(PropertyRequests, NewEntryIsInserted) {
    process({{"_id_", "new-1"}, {"_newid_", 1}, {"name", "c"}, {"value", "v"}});
    EXPECT_EQ(row("id,name,value,protect"), "1|c|v|f");
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(PropertyRequests, FlagTextWithLeadingZerosCounts) {
    process({{"_newid_", "01"}, {"name", "c"}, {"protect", "01"}});
    EXPECT_EQ(row("name,protect"), "c|f");  // here, and nowhere else
}

TEST_F(PropertyRequests, EntryWithoutFlagsIsAnUpdateWithBothItsLogLines) {
    sql("insert into properties(id,name,value,protect) values(1,'a','v','f')");
    process({{"_id_", "1"}, {"value", "w"}, {"_obsoleteid_", false}, {"_newid_", "no"}});
    EXPECT_EQ(row("value"), "w");
    EXPECT_EQ(log.lines, (std::vector<std::string>{"adminhost_lumio: update property",
                                                   "adminhost_lumio: update property -> write"}));
}

TEST_F(PropertyRequests, FailedEntriesAreLoggedAndTheOthersStillApplied) {
    sql("insert into properties(id,name,value) values(1,'a','v'),(2,'b','v'),(3,'c','v');"
        "create trigger keep before delete on properties when old.id=1 begin select raise(abort,'kept'); end;");
    const Array changes{Dictionary{{"_id_", "1"}, {"_obsoleteid_", true}}, Dictionary{{"_newid_", true}, {"name", "a"}},
                        Dictionary{{"_id_", "3"}, {"name", "b"}}, "no entry",
                        Dictionary{{"_id_", "2"}, {"_obsoleteid_", true}}};
    (void)handler.processPropertyChangesWithRequest(&changes);
    EXPECT_EQ(sql("select id,name from properties"), "1|a\n3|c\n");
    ASSERT_EQ(log.lines.size(), 6U);
    EXPECT_TRUE(log.lines[0].starts_with("error deleting property with ID:\n1\n  error:: sqliteQuery (19): "));
    EXPECT_TRUE(
        log.lines[1].starts_with("adminhost_lumio: could not delete property with id: 1, error: sqliteQuery (19)"));
    EXPECT_EQ(log.lines[2],
              "adminhost_lumio: could not insert new property: sqliteQuery (2): Property name 'a' already exists with "
              "value 'v'");
    EXPECT_EQ(log.lines[5],
              "adminhost_lumio: could not update property with id: 3, error: sqliteQuery (2): Property name 'b' "
              "already exists "
              "with value 'v'");
}

TEST_F(PropertyRequests, NullAndEmptyListsDoNothing) {
    const Array none;
    EXPECT_EQ(handler.processPropertyChangesWithRequest(nullptr).kind(), Response::Kind::nothing);
    EXPECT_EQ(handler.processPropertyChangesWithRequest(&none).kind(), Response::Kind::nothing);
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(PropertyRequests, FailedProtectionIsLoggedWithoutTheValue) {
    root.writePropertyList(keyPath, "");
    process({{"_newid_", true}, {"name", "n"}, {"value", "hidden"}, {"protect", true}});
    EXPECT_EQ(log.lines, (std::vector<std::string>{
                             "kek shared_secret not found",
                             "adminhost_lumio: could not insert new property: LumioPropertyCantEncryptValue (1)"}));
    EXPECT_EQ(sql("select count(*) from properties"), "0\n");
}

TEST_F(PropertyRequests, VariantsGetConfigAndGetPropertiesHaveTheProperties) {
    sql("insert into properties(id,name) values(1,'n')");
    EXPECT_EQ(configuration("getProperties").get("properties").array()->size(), 1U);
    EXPECT_EQ(configuration("getProperties").size(), 2U);
    EXPECT_EQ(configuration("getConfig").get("properties").array()->size(), 1U);
    EXPECT_FALSE(configuration("getCameras").contains("properties"));
}

TEST_F(PropertyRequests, PasswordIsSetWhenItDeciphersToATextThatIsNotEmpty) {
    EXPECT_EQ(passwordFlag(), Value());
    useClusterPreferences("<key>nimbo_controller</key><string>grid</string>");
    EXPECT_EQ(passwordFlag(), Value(false));
    EXPECT_TRUE(log.lines.empty());
    useClusterPreferences("<key>nimbo_client_password</key><string>" + protectedByOpenssl("geheim") + "</string>");
    EXPECT_EQ(passwordFlag(), Value(true));
    useClusterPreferences("<key>nimbo_client_password</key><string>" + protectedByOpenssl("") + "</string>");
    EXPECT_EQ(passwordFlag(), Value(false));
    useClusterPreferences("<key>nimbo_client_password</key><string>plain words</string>");
    EXPECT_EQ(passwordFlag(), Value(false));
    EXPECT_EQ(log.lines, std::vector<std::string>{"no convertedValueData from aes128cbc..."});
    Dictionary config;
    handler.copyClusterPreferencesToConfig(config);
    EXPECT_FALSE(config.contains("nimbo_client_password"));
}

TEST_F(PropertyRequests, PasswordComesBackInPlainText) {
    EXPECT_EQ(
        LumioRequestHandler::nimboClientPasswordFromPrefs({{"nimbo_client_password", protectedByOpenssl("geheim")}}),
        "geheim");
    EXPECT_EQ(LumioRequestHandler::nimboClientPasswordFromPrefs({}), std::nullopt);
}

}  // namespace
}  // namespace lumio
