#pragma once

// Independent statements of one listing, several of them running at a time.
//
// The results are those of runStatement() for each statement in turn, and are returned in that order. As many tools run
// at once as there are processors, at most 8. At most 64 results are kept until their turn. All share the request's
// deadline, one bound on captured bytes, and the database whose path is known when the batch is made. With one
// statement or one processor the tools run one after the other.

#include "platform/files/Path.h"
#include "platform/task/TaskGroup.h"
#include "settings/QueryRunner.h"

#include <cstddef>
#include <string>
#include <vector>

namespace lumio {

class StatementBatch {
  public:
    /// `atOnce`: how many tools may run at the same time; 0 chooses as described above.
    explicit StatementBatch(std::vector<std::string> statements, std::size_t atOnce = 0);

    /// The result of the next statement, as runStatement() returns it. Called once for each statement.
    [[nodiscard]] adminhost::Result<std::vector<adminhost::Dictionary>> next();

  private:
    void startMore();
    [[nodiscard]] std::size_t running() const;
    [[nodiscard]] adminhost::TaskResult runAlone();

    adminhost::HostPath _database;
    std::vector<std::string> _statements;
    std::size_t _atOnce;
    std::vector<adminhost::TaskGroup::Id> _tasks;  ///< of the statements that were started, in their order
    std::size_t _next = 0;                         ///< the statement whose result is returned next
    adminhost::TaskGroup _group;
};

}  // namespace lumio
