#include "adminhostctl/lumio/VerbExamples.h"

#include <array>
#include <string_view>

namespace adminhost::ctl {
namespace {

struct Examples {
    std::string_view words;  ///< of the verb
    std::array<std::string_view, 2> examples;
};

constexpr std::array examplesOfVerbs = {
    Examples{"settings get", {{"settings get", "settings get server_port"}}},
    Examples{"explain", {{"explain server_port", "--format json explain shared_filesystem"}}},
    Examples{"settings set",
             {{"settings set server_port 8170", "settings set nimbo_client_password @password.txt --validate"}}},
    Examples{"plan", {{"plan host.toml", "plan base.toml host2.toml --only settings,cameras --exit-code"}}},
    Examples{"history", {{"history --since yesterday", "--format json history --user anna --key server_port"}}},
};

}  // namespace

void addExamples(std::vector<Verb>& verbs) {
    for (Verb& verb : verbs) {
        for (const Examples& one : examplesOfVerbs) {
            if (verb.words == one.words && verb.examples.front().empty()) {
                verb.examples = one.examples;
            }
        }
    }
}

}  // namespace adminhost::ctl
