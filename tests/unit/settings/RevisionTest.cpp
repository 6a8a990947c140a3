#include "settings/Revision.h"
#include "tests/unit/handler/WriteSettingsFixture.h"

namespace lumio {
namespace {

using Revision = WriteSettings;

TEST_F(Revision, RevisionChangesWithSettingsAndResourcesAndNotWithWhatTheServiceDoes) {
    makeDatabase();
    const std::string first = settingsRevision();
    EXPECT_EQ(settingsRevision(), first);
    root.sql(database, "update cameras set recording_status='capturing', used_at='2026-01-01 00:00:00'");
    EXPECT_EQ(settingsRevision(), first);
    (void)write({});
    EXPECT_EQ(settingsRevision(), first) << "rewriting the same values changes nothing";
    (void)write({{"server_port", 99}});
    const std::string second = settingsRevision();
    EXPECT_NE(second, first);
    root.sql(database, "insert into access_control_entries values('U','Camera',1)");
    const std::string third = settingsRevision();
    EXPECT_NE(third, second);
    root.sql(database, "update properties set value='a' || char(10) || 'b'");
    const std::string fourth = settingsRevision();
    EXPECT_NE(fourth, third);
    root.sql(database, "update properties set value='a' || char(10) || 'c'");
    EXPECT_NE(settingsRevision(), fourth);
    root.sql(database, "drop table properties");
    const std::string fifth = settingsRevision();
    EXPECT_NE(fifth, fourth);
    EXPECT_EQ(settingsRevision(), fifth);
    root.sql(database, "update access_control_entries set record_uuid='V'");
    EXPECT_NE(settingsRevision(), fifth) << "what can still be read still counts";
}

}  // namespace
}  // namespace lumio
