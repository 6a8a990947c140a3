#include "settings/StatementBatch.h"
#include "tests/support/TemporaryRoot.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace lumio {
namespace {

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

// The last reader to close a WAL database removes its files, and a reader that comes at that moment is refused.
TEST(ParallelReads, NoneOfTenThousandOfAWalDatabaseThatNobodyElseHasOpenFails) {
    const adminhost::test::TemporaryRoot root;
    root.sql(database, "pragma journal_mode=wal; create table t(id integer primary key); insert into t values(7);");
    const std::size_t count = 10'000;
    StatementBatch batch(std::vector<std::string>(count, "select id from t"), 8);
    std::size_t failures = 0;
    for (std::size_t i = 0; i < count; ++i) {
        const auto rows = batch.next();
        if (!rows || *rows != std::vector<adminhost::Dictionary>{{{"id", "7"}}}) {
            ++failures;
        }
    }
    EXPECT_EQ(failures, 0U);
}

}  // namespace
}  // namespace lumio
