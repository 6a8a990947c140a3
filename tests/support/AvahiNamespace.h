#pragma once

// Tests against a real Avahi daemon, in namespaces of their own (see with-avahi).
//
//     int main(int argc, char** argv) {
//         adminhost::test::enterAvahiNamespace(argc, argv);
//         testing::InitGoogleTest(&argc, argv);
//         return RUN_ALL_TESTS();
//     }

#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost::test {

/// Runs this program again inside and exits with its status. Returns if it runs inside already.
void enterAvahiNamespace(int argc, char** argv);

/// A service on port 7777 of this host, whose address 10.77.0.1 has the name controller.test.example; published
/// with Avahi's own tool while the object exists. Throws std::runtime_error on failure.
class PublishedService {
  public:
    PublishedService(const std::string& name, const std::string& type);
    PublishedService(const PublishedService&) = delete;
    PublishedService& operator=(const PublishedService&) = delete;
    ~PublishedService();

  private:
    pid_t _child = -1;
};

/// While it exists, the Avahi daemon does not answer.
class SilentAvahi {
  public:
    SilentAvahi();
    SilentAvahi(const SilentAvahi&) = delete;
    SilentAvahi& operator=(const SilentAvahi&) = delete;
    ~SilentAvahi();

  private:
    pid_t _daemon;
};

}  // namespace adminhost::test
