#pragma once

// Common code of the daemon's tests: a daemon with the fixture plug-in.

#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"

#include <chrono>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace adminhost::test {

inline std::string pluginFile(const std::string& name) {
    return std::string(BINARY_DIR) + "/tests/plugins/" + name + ".so";
}

inline DaemonProcess::Options withFixture(const std::string& configuration = "") {
    return {{"--plugin", pluginFile("fixture_good")}, configuration, {}, true, {}, 0, -1};
}

inline Dictionary dictionaryOf(const HttpReply& reply) {
    const auto value = parseJson(reply.body);
    EXPECT_TRUE(value && value->dictionary() != nullptr) << reply.status << ": " << reply.body;
    return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary();
}

/// An error answer: its code and a message, in the two keys.
inline void expectError(const HttpReply& reply, int status, std::string_view code) {
    EXPECT_EQ(reply.status, status) << reply.body;
    const Dictionary body = dictionaryOf(reply);
    EXPECT_EQ(body.text("error"), code);
    EXPECT_FALSE(body.text("message").empty());
    EXPECT_EQ(body.size(), body.contains("findings") || body.contains("state") ? 3U : 2U);
    EXPECT_TRUE(reply.headers.contains("request-id"));
}

/// A client whose write has begun. It ends when the file "go" exists in the directory, and writes the text to "data".
inline UnixHttp startHeldWrite(const DaemonProcess& daemon, const std::filesystem::path& directory,
                               const std::string& text) {
    const auto place = [&](const char* name) { return (directory / name).string(); };
    UnixHttp client = daemon.connect();
    client.begin("POST", "/v1/fixture/runWrite",
                 R"({"script": "touch )" + place("begun") + "; until [ -e " + place("go") +
                     " ]; do sleep 0.01; done; echo " + text + " > " + place("data") + "\"}");
    EXPECT_TRUE(eventually([&] { return std::filesystem::exists(place("begun")); }));
    return client;
}

/// A client whose operation is running when this returns.
inline UnixHttp startSleeping(const DaemonProcess& daemon, int milliseconds) {
    const std::string mark = (daemon.directory() / "running").string();
    std::filesystem::remove(mark);
    UnixHttp client = daemon.connect();
    client.begin("POST", "/v1/fixture/sleep",
                 R"({"milliseconds":)" + std::to_string(milliseconds) + R"(,"touch":")" + mark + "\"}");
    EXPECT_TRUE(eventually([&] { return std::filesystem::exists(mark); }));
    return client;
}

/// Opens so many connections in each burst, each with an unfinished request, waits until the daemon holds as many as it
/// can, and closes them all. After each burst an ordinary request must be answered within a second.
inline void burst(const DaemonProcess& daemon, int bursts, int connections) {
    for (int i = 0; i < bursts; ++i) {
        {
            std::vector<UnixHttp> clients;
            for (int n = 0; n < connections; ++n) {
                clients.push_back(daemon.connect());
                try {
                    clients.back().send("GET /v1/ HTTP/1.1\r\n");
                } catch (const std::runtime_error&) {
                    // The daemon may have refused this one already.
                }
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        UnixHttp ordinary(daemon.socket(), std::chrono::seconds(1));
        ASSERT_EQ(ordinary.get("/v1/").status, 200) << "after burst " << i;
    }
}

}  // namespace adminhost::test
