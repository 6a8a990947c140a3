#pragma once

// A service with a database, a key file and no properties yet.

#include "resources/Property.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryRoot.h"

#include <string>

#include <gtest/gtest.h>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Value;

constexpr std::string_view identityPath = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view keyPath = "/shared/Server/Secrets/kek.plist";
constexpr std::string_view databasePath = "/shared/Server/db.sqlite3";
constexpr const char* vectorHex = "4c756d696f50726f7065727479495631";

class PropertyFixture : public testing::Test {
  protected:
    void SetUp() override {
        root.writePropertyList(identityPath, "<key>shared_filesystem</key><string>/shared</string>");
        useSecret("bHVtaW8tc2FtcGxlLWtleQ==");
        sql("create table properties(id integer primary key autoincrement,name,value,protect,created_at,updated_at);");
    }

    void useSecret(const std::string& text) const {
        root.writePropertyList(keyPath, "<key>lumio_secret</key><string>" + text + "</string>");
    }
    std::string sql(const std::string& statements) const { return root.sql(databasePath, statements); }
    /// The columns of the only row, separated by "|".
    [[nodiscard]] std::string row(const std::string& columns) const {
        std::string text = sql("select " + columns + " from properties");
        return text.substr(0, text.rfind('\n'));
    }
    [[nodiscard]] std::string storedValue() const {
        const std::string hex = row("hex(value)");
        std::string value;
        for (std::size_t i = 0; i + 1 < hex.size(); i += 2) {
            value += static_cast<char>(std::stoi(hex.substr(i, 2), nullptr, 16));
        }
        return value;
    }
    /// The protected form without its line feeds, created by the openssl tool.
    [[nodiscard]] std::string protectedByOpenssl(const std::string& plain) const {
        root.write("/plain", plain);
        return adminhost::test::runProgram({"openssl", "enc", "-aes-128-cbc", "-K", "6c756d696f2d73616d706c652d6b6579",
                                            "-iv", vectorHex, "-base64", "-A", "-in", root.path("/plain").string()})
            .output;
    }

    static std::optional<Error> insert(const Dictionary& request) {
        return Property::initNewPropertyWithDictionary(request)->write();
    }
    static std::optional<Error> change(const Dictionary& request) {
        return Property::initWithChangeRequest(request)->write();
    }
    /// The records of the listing.
    static std::vector<Dictionary> listed() {
        std::optional<Error> error;
        const auto properties = Property::allPropertiesWithError(error);
        EXPECT_FALSE(error);
        std::vector<Dictionary> records;
        if (properties) {
            for (const auto& property : *properties) {
                records.push_back(*property->dictionary());
            }
        }
        return records;
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
};

}  // namespace lumio
