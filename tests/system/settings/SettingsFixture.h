#pragma once

// The sample service behind the daemon, for the tests of its settings and their history.

#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace adminhost::test {

class Settings : public testing::Test {
  protected:
    [[nodiscard]] DaemonProcess::Options options() const {
        DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        return options;
    }
    [[nodiscard]] HttpReply post(const std::string& command, const std::string& body,
                                 const UnixHttp::Headers& headers = {}) const {
        return daemon.connect().post("/v1/lumio/" + command, body, headers);
    }
    [[nodiscard]] static Value valueOf(const HttpReply& reply) {
        const auto value = parseJson(reply.body);
        EXPECT_TRUE(value) << reply.body;
        return value ? *value : Value();
    }
    [[nodiscard]] ProgramResult ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
        return runProgram(words, Errors::merge);
    }

    const SampleRoot root;
    const DaemonProcess daemon{options()};
};

}  // namespace adminhost::test
