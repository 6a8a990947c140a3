#include "adminhostd/FrontAnswers.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr const char* retrySeconds = "1";

HttpAnswer findingsAnswer(const std::vector<Finding>& findings) {
    const Finding& first = findings.front();
    HttpAnswer answer =
        errorAnswer(422, "REQUEST_REFUSED",
                    fmt::format("The request cannot be carried out. {}{}: {}.",
                                findings.size() == 1 ? "" : fmt::format("The first of {} findings: ", findings.size()),
                                first.keyPath, first.rule));
    Array list;
    for (const Finding& finding : findings) {
        list.emplace_back(Dictionary{{"keyPath", finding.keyPath}, {"rule", finding.rule}, {"advice", finding.advice}});
    }
    answer.body->dictionary()->set("findings", std::move(list));
    return answer;
}

HttpAnswer textAnswer(unsigned status, protocol::Answer& answer) {
    HttpAnswer http{status, std::nullopt, {}};
    http.text = AnswerText{std::make_shared<const std::string>(std::move(answer.bytes)), answer.form == BodyForm::json
                                                                                             ? "application/json"  //
                                                                                             : "application/x-plist"};
    return http;
}

}  // namespace

HttpAnswer errorAnswer(unsigned status, std::string_view code, std::string_view message) {
    return {status, Dictionary{{"error", code}, {"message", message}}, {}};
}

HttpAnswer retryLater(std::string_view code, std::string_view message) {
    HttpAnswer answer = errorAnswer(503, code, message);
    answer.headers.emplace_back("Retry-After", retrySeconds);
    return answer;
}

std::string_view codeOf(const HttpAnswer& answer) {
    const Dictionary* body = answer.status >= 400 && answer.body ? answer.body->dictionary() : nullptr;
    return body == nullptr ? std::string_view() : body->text("error");
}

HttpAnswer answerFor(protocol::Answer& answer) {
    using protocol::Outcome;
    switch (answer.outcome) {
        case Outcome::nothing:
            return {204, std::nullopt, {}};
        case Outcome::answered:
            return textAnswer(200, answer);
        case Outcome::error:
            return textAnswer(500, answer);
        case Outcome::later:
            return retryLater(answer.error, answer.message);
        case Outcome::refused:
            return findingsAnswer(answer.findings);
        case Outcome::conflict:
            return errorAnswer(412, "REVISION_CHANGED",
                               "The settings have changed since they were read. Read them again.");
        case Outcome::overrun:
            return errorAnswer(504, "DEADLINE_EXCEEDED", "The command did not end in time and was stopped.");
        case Outcome::locked:
            return retryLater("WRITE_LOCKED", answer.message);
        case Outcome::absent:
            return errorAnswer(404, answer.error, answer.message);
        case Outcome::checked:  // doctorAnswer()
        case Outcome::broken:
            break;
    }
    return errorAnswer(500, "WORKER_FAILED", answer.message);
}

HttpAnswer answerFor(const Unserved& unserved) {
    using Reason = Unserved::Reason;
    switch (unserved.reason) {
        case Reason::overrun:
            return errorAnswer(
                504, "DEADLINE_EXCEEDED",
                unserved.message.empty() ? "The command did not end in time and was stopped." : unserved.message);
        case Reason::unavailable:
            return retryLater("WORKER_UNAVAILABLE", unserved.message);
        case Reason::stopping:
            return retryLater("STOPPING", unserved.message);
        case Reason::cancelled:
            return errorAnswer(503, "CANCELLED", "The request was cancelled before it ended (DELETE /v1/requests/ID).");
        case Reason::abandoned:
            return retryLater("CLIENT_GONE", unserved.message);
        case Reason::notBegun:
            return retryLater("WORKER_BUSY", unserved.message);
        case Reason::failed:
        case Reason::tooLarge:
            break;
    }
    return errorAnswer(500, "WORKER_FAILED", unserved.message);
}

HttpAnswer unknownRequest(std::string_view id) {
    HttpAnswer answer = errorAnswer(
        404, "UNKNOWN_REQUEST", fmt::format("The request \"{}\" is not among the latest {}.", id, RequestLog::length));
    answer.body->dictionary()->set("state", "unknown");
    return answer;
}

}  // namespace adminhost
