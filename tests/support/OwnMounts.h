#pragma once

// File systems of a test's own: it mounts them in namespaces of its own, in which every account is the superuser.
//
//     int main(int argc, char** argv) {
//         adminhost::test::enterOwnMounts(argc, argv);
//         testing::InitGoogleTest(&argc, argv);
//         return RUN_ALL_TESTS();
//     }

#include <filesystem>

namespace adminhost::test {

/// Runs this program again as the superuser of a user namespace, with mounts of its own. Returns in that second run.
/// Throws std::runtime_error if the account cannot create namespaces.
void enterOwnMounts(int argc, char** argv);

inline constexpr const char* smallFileSystem = "size=64k,mode=755";

/// A file system in memory, mounted at a directory while the object exists. Throws if it cannot be mounted.
class Mount {
  public:
    explicit Mount(std::filesystem::path place, const char* options = smallFileSystem);
    Mount(const Mount&) = delete;
    Mount& operator=(const Mount&) = delete;
    ~Mount();

    // Each throws if it did not succeed.

    void makeReadOnly() const;
    /// Fills the file system to the last byte.
    void fill() const;
    void makeRoom() const;

  private:
    std::filesystem::path _place;
};

/// A file system whose server never replies, mounted at a directory while the object exists. Every access to it waits
/// until then; a process that waits can be killed.
class HangingMount {
  public:
    explicit HangingMount(std::filesystem::path place);
    HangingMount(const HangingMount&) = delete;
    HangingMount& operator=(const HangingMount&) = delete;
    ~HangingMount();

  private:
    std::filesystem::path _place;
    int _server = -1;
};

}  // namespace adminhost::test
