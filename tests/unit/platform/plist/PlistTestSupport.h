#pragma once

// Common code of the property-list tests: a directory of their own, and Python's plistlib as an independent reader.

#include "platform/plist/PropertyList.h"
#include "platform/task/Task.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

namespace adminhost {

class PlistTest : public testing::Test {
  protected:
    void SetUp() override {
        std::string place = std::filesystem::temp_directory_path() / "plist-XXXXXX";
        ASSERT_NE(::mkdtemp(place.data()), nullptr);
        _dir = place;
    }
    void TearDown() override { std::filesystem::remove_all(_dir); }

    [[nodiscard]] std::string path(const std::string& name) const { return _dir / name; }

    void writeBytes(const std::string& name, const std::string& bytes) const {
        std::ofstream(path(name), std::ios::binary) << bytes;
    }
    [[nodiscard]] std::string readBytes(const std::string& name) const {
        std::ifstream file(path(name), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }

    /// Runs Python statements with plistlib, datetime and the paths given as sys.argv[1:].
    static void python(const std::string& statements, std::vector<std::string> arguments) {
        arguments.insert(arguments.begin(), {"-c", "import sys, plistlib, datetime\n" + statements});
        std::string error;
        EXPECT_EQ(launch_task(DiskPath("/usr/bin/python3"), arguments, nullptr, &error), 0) << error;
    }

    std::filesystem::path _dir;
};

}  // namespace adminhost
