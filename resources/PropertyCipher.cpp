#include "codec/LumioAESCategories.h"
#include "platform/crypto/Crypt.h"
#include "platform/files/File.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"
#include "settings/SettingsStore.h"

namespace lumio {

using adminhost::Data;
using adminhost::logEvent;
using adminhost::ScopedCleanse;
using adminhost::textOf;
using adminhost::Value;

namespace {

Bytes bytesOf(std::string_view text) noexcept {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

/// The key file belongs to the service, which creates it when it is set up; here it is only read, on every call.
std::optional<Data> keyEncryptionKey() {
    const auto preferences = SettingsStore::identityPreferences();
    const Value sharedFilesystem = preferences ? preferences->get("shared_filesystem") : Value();
    const std::string path = textOf(sharedFilesystem) + "/Server/Secrets/kek.plist";
    Value file;
    if (!sharedFilesystem.isNull()) {
        auto bytes = adminhost::readFile(adminhost::diskPath(adminhost::HostPath(path)), adminhost::plistMaximumSize);
        if (bytes) {
            const ScopedCleanse wipeFile(*bytes);
            file = adminhost::parsePropertyList(*bytes).value_or(Value());
        }
    }
    if (file.dictionary() == nullptr) {
        logEvent("failed to load " + path);
        return std::nullopt;
    }
    const std::string* secret = file.dictionary()->get("lumio_secret").string();
    if (secret == nullptr) {
        logEvent("kek shared_secret not found");
        return std::nullopt;
    }
    Data key = base64DecodedData(*secret);
    // These are copies of the file's values; they must not stay in memory.
    adminhost::cleanse(const_cast<char*>(secret->data()), secret->size());
    return key;
}

}  // namespace

std::optional<std::string> Property::encryptValue(const Value& value) {
    return cryptedValue(value, true);
}

std::optional<std::string> Property::decryptValue(const Value& value) {
    return cryptedValue(value, false);
}

std::optional<std::string> Property::cryptedValue(const Value& value, bool encrypt) {
    if (value.isNull()) {
        return std::nullopt;
    }
    std::optional<Data> key = keyEncryptionKey();
    if (!key) {
        return std::nullopt;
    }
    const ScopedCleanse wipeKey(*key);
    std::string text = textOf(value);
    const ScopedCleanse wipeText(text);
    std::optional<Data> converted = encrypt
                                        ? aes128cbcEncryptDataWithKey(bytesOf(text), *key)
                                        : aes128cbcDecryptDataWithKey(LumioUtilities_decodeBase64(bytesOf(text)), *key);
    if (!converted) {
        logEvent("no convertedValueData from aes128cbc...");
        return std::nullopt;
    }
    if (encrypt) {
        return base64EncodedString(*converted);
    }
    const ScopedCleanse wipePlain(*converted);
    std::string plain(reinterpret_cast<const char*>(converted->data()), converted->size());
    if (!adminhost::isUtf8(plain)) {
        adminhost::cleanse(plain.data(), plain.size());
        return std::nullopt;
    }
    return plain;
}

}  // namespace lumio
