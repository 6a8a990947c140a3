#include "adminhostd/ReportForm.h"

#include <string>

namespace adminhost {

Dictionary reportOf(const Change& change) {
    return {{"section", change.section},
            {"identity", change.identity},
            {"name", change.name},
            {"key", change.key},
            {"from", change.from},
            {"to", change.to},
            {"secret", change.secret},
            {"undo", change.undo},
            {"unverified", change.unverified ? Value(true) : Value()}};
}

Dictionary reportOf(const NotDone& part) {
    return {{"keyPath", part.keyPath}, {"reason", part.reason}, {"toolMessage", part.toolMessage}};
}

Change changeOf(const Dictionary& report) {
    return {std::string(report.text("section")),
            std::string(report.text("identity")),
            std::string(report.text("name")),
            std::string(report.text("key")),
            report.get("from"),
            report.get("to"),
            report.get("secret").boolean().value_or(false),
            report.get("undo"),
            report.get("unverified").boolean().value_or(false)};
}

NotDone notDoneOf(const Dictionary& report) {
    return {std::string(report.text("keyPath")), std::string(report.text("reason")),
            std::string(report.text("toolMessage"))};
}

}  // namespace adminhost
