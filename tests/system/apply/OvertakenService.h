#pragma once

// Two clients at once: one changes something while a verb of the other is between reading and writing.

#include "tests/system/apply/ControlledService.h"

#include <chrono>
#include <filesystem>
#include <future>
#include <string>
#include <vector>

namespace adminhost::test {

class OvertakenService : public ControlledService {
  protected:
    /// Runs a verb whose state is changed by `other` after it has been read and before it is written. The other
    /// client's write waits in the queue behind the verb's first read.
    [[nodiscard]] ProgramResult overtaken(const std::vector<std::string>& words, const std::string& other,
                                          const std::string& tool = "setup_preferences") const {
        root.hold(tool);
        std::future<ProgramResult> result = std::async(std::launch::async, [&] { return ctl(words); });
        EXPECT_TRUE(root.waitForHeld(tool));
        UnixHttp client(daemon.socket(), std::chrono::seconds(60));
        client.begin("POST", "/v1/lumio/writeSettings", other);
        EXPECT_TRUE(daemon.waitForWaiting(1));
        root.release(tool);
        EXPECT_EQ(client.reply().status, 200);
        return result.get();
    }
    /// Lets the tests hold the database tool, under the name "sqlite3".
    void makeDatabaseToolHoldable() const {
        root.write("/usr/bin/sqlite3", "#!/bin/sh\nplace=/usr/bin/sqlite3\nswitches=sqlite3\nroot='" + root.path() +
                                           "'\n. \"$root/usr/share/sorvaneproducer/demo/tool.sh\"\n"
                                           "exec /usr/bin/sqlite3 \"$@\"\n");
        std::filesystem::permissions(root.disk("/usr/bin/sqlite3"), std::filesystem::perms(0755));
    }
};

}  // namespace adminhost::test
