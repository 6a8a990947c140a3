#pragma once

// A directory for the files of one test of tools. Bounds and deadline of tools are those of a fresh process again after
// the test.

#include "platform/task/Task.h"
#include "platform/task/TaskBounds.h"

#include <csignal>
#include <filesystem>
#include <optional>
#include <string>
#include <thread>

#include <gtest/gtest.h>
#include <unistd.h>

namespace adminhost {

class TaskDirectory : public testing::Test {
  protected:
    void SetUp() override {
        std::string place = std::filesystem::temp_directory_path() / "task-XXXXXX";
        ASSERT_NE(::mkdtemp(place.data()), nullptr);
        _dir = place;
        prepareForTasks();
    }
    void TearDown() override {
        setTaskDeadline(std::nullopt);
        setTaskOutputBound(taskDefaultOutputBound);
        std::filesystem::remove_all(_dir);
    }

    std::filesystem::path _dir;
};

inline std::ptrdiff_t openDescriptors() {
    namespace fs = std::filesystem;
    return std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator{});
}

inline bool isAlive(pid_t pid) {
    return ::kill(pid, 0) == 0;
}

inline bool isGoneSoon(pid_t pid) {
    for (int i = 0; i < 1000 && isAlive(pid); ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return !isAlive(pid);
}

}  // namespace adminhost
