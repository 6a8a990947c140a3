// A second plug-in, as small as possible. It shows that the host needs no knowledge of a plug-in beyond its interface.
// It stores its settings in a file of its own format ("KEY VALUE" lines) and has no database.

#include "platform/files/Path.h"
#include "platform/framework/Plugin.h"
#include "platform/framework/Report.h"

#include <cstdio>
#include <fstream>
#include <functional>
#include <map>
#include <string>

#include <unistd.h>

namespace {

using adminhost::Access;
using adminhost::Array;
using adminhost::Command;
using adminhost::Dictionary;
using adminhost::DictionaryEntry;
using adminhost::HostPath;
using adminhost::Probe;
using adminhost::Response;
using adminhost::Value;

constexpr const char* secretKey = "passphrase";

HostPath settingsFile() {
    return HostPath("/etc/beacon.conf");
}
HostPath unfinishedFile() {
    return HostPath("/etc/beacon.conf.unfinished");
}

bool exists(const char* hostPath) {
    return ::access(adminhost::diskPath(HostPath(hostPath)).c_str(), F_OK) == 0;
}

Dictionary stored() {
    Dictionary values;
    std::ifstream file(adminhost::diskPath(settingsFile()).text());
    std::string key;
    std::string value;
    while (file >> key && std::getline(file >> std::ws, value)) {
        values.set(key, value);
    }
    return values;
}

bool store(const Dictionary& values) {
    const std::string unfinished = adminhost::diskPath(unfinishedFile()).text();
    std::ofstream file(unfinished);
    for (const DictionaryEntry& entry : values) {
        file << entry.key << ' ' << *entry.value.string() << '\n';
    }
    file.close();
    return file.good() && std::rename(unfinished.c_str(), adminhost::diskPath(settingsFile()).c_str()) == 0;
}

Dictionary keyDescription(const char* path, const char* help) {
    return {{"path", path}, {"type", "text"}, {"help", help}};
}

class SmallPlugin final : public adminhost::Plugin {
  public:
    std::string_view name() override { return "small"; }
    std::string_view version() override { return "0.1"; }

    std::vector<Command> commands() override {
        Dictionary secret = keyDescription(secretKey, "Opens the lid.");
        secret.set("secret", true);
        Command show;
        show.name = "show";
        show.access = Access::read;
        show.showsRevision = true;
        show.description = {{"summary", "Show the settings"}, {"keys", Array()}};
        Command set;
        set.name = "set";
        set.access = Access::write;
        set.takesRevision = true;
        set.description = {{"summary", "Change the settings"},
                           {"keys", Array{keyDescription("greeting", "What it says."), std::move(secret)}}};
        Command flash;
        flash.name = "flash";
        flash.access = Access::control;
        flash.needs = {"lamp"};
        flash.deadline = std::chrono::seconds(2);
        flash.description = {{"summary", "Flash once"}, {"keys", Array()}};
        return {show, set, flash};
    }

    void configure(const std::vector<std::string>& languages) override { _languages = languages; }

    std::vector<adminhost::Finding> check(std::string_view, const Dictionary& request) override {
        std::vector<adminhost::Finding> findings;
        for (const DictionaryEntry& entry : request) {
            const std::string* text = entry.value.string();
            if (text == nullptr || text->find('\n') != std::string::npos) {
                findings.push_back({entry.key, "is not one line of text", "send one line"});
            }
        }
        return findings;
    }

    Response perform(std::string_view command, const Dictionary& request) override {
        if (command == "show") {
            adminhost::announceReading();
            Dictionary values = stored();
            values.remove(secretKey);
            values.set("languages", Array(_languages.begin(), _languages.end()));
            return values;
        }
        if (command == "flash") {
            return nullptr;
        }
        Dictionary values = stored();
        for (const DictionaryEntry& entry : request) {
            values.set(entry.key, entry.value);
        }
        if (!store(values)) {
            return Response::error("NOT_STORED", "The settings could not be stored.");
        }
        for (const DictionaryEntry& entry : request) {
            adminhost::Change change;
            change.section = "settings";
            change.key = entry.key;
            change.secret = entry.key == secretKey;
            change.to = change.secret ? Value() : entry.value;
            adminhost::reportChange(std::move(change));
        }
        return Dictionary{{"stored", true}};
    }

    Probe probe(std::string_view) override {
        if (exists("/etc/beacon.broken")) {
            return {Probe::State::unusable, "the lamp is broken", "replace it"};
        }
        if (exists("/etc/beacon.dark")) {
            return {Probe::State::unknown, "it is too dark to see the lamp", "wait for the morning"};
        }
        return {};
    }

    std::vector<adminhost::Diagnosis> diagnose() override {
        return {{adminhost::Diagnosis::Health::ok, "lamp", "The lamp is there.", ""}};
    }

    std::string revision() override {
        std::string all;
        for (const DictionaryEntry& entry : stored()) {
            all += entry.key + ' ' + *entry.value.string() + '\n';
        }
        return std::to_string(std::hash<std::string>()(all));
    }

    std::vector<adminhost::Setting> settingKeys() override { return {{"greeting", false, 0}, {secretKey, true, 0}}; }
    adminhost::Result<Dictionary> settings() override { return stored(); }
    std::vector<HostPath> settingsFiles() override { return {settingsFile()}; }
    std::vector<adminhost::LogFile> logs() override { return {{"log", HostPath("/var/log/beacon.log")}}; }
    std::vector<HostPath> leftovers() override { return {unfinishedFile()}; }
    std::vector<adminhost::ToolFile> toolFiles() override { return {{"beacon/rc", "quiet\n"}}; }

  private:
    std::vector<std::string> _languages;
};

}  // namespace

ADMINHOST_PLUGIN(SmallPlugin)
