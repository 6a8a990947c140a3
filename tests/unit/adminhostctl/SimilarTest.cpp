#include "adminhostctl/Similar.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

const std::vector<std::string> keys{"server_port", "server_host", "tunnel_agent_port", "list", "Éditing suite"};

TEST(Similar, TypoSuggestsTheNameThatDiffersLeast) {
    EXPECT_EQ(didYouMean("server_prt", keys), "; did you mean \"server_port\"?");
    EXPECT_EQ(didYouMean("sevrer_host", keys), "; did you mean \"server_host\"?");
    EXPECT_EQ(didYouMean("SERVER_PORT", keys), "; did you mean \"server_port\"?");
    EXPECT_EQ(didYouMean("lst", keys), "; did you mean \"list\"?");
    EXPECT_EQ(didYouMean("lsit", keys), "; did you mean \"list\"?") << "two swapped letters are one mistake";
    EXPECT_EQ(didYouMean("Editing suite", keys), "; did you mean \"Éditing suite\"?");
}

TEST(Similar, NameThatIsTooDifferentSuggestsNothing) {
    EXPECT_EQ(didYouMean("submissions_groupname", keys), "");
    EXPECT_EQ(didYouMean("get", keys), "");
    EXPECT_EQ(didYouMean("", keys), "");
    EXPECT_EQ(didYouMean("server_port", {}), "");
}

TEST(Similar, LongWordIsNotCompared) {
    const std::vector<std::string> same{std::string(4096, 'a')};
    EXPECT_EQ(didYouMean(std::string(4096, 'a'), same), "");
}

}  // namespace
}  // namespace adminhost::ctl
