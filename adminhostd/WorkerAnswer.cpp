#include "adminhostd/WorkerAnswer.h"

#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"

#include <utility>

namespace adminhost {

protocol::Answer broken(std::string message) {
    protocol::Answer answer;
    answer.outcome = protocol::Outcome::broken;
    answer.message = std::move(message);
    return answer;
}

protocol::Answer written(protocol::Outcome outcome, const Value& response, BodyForm form) {
    protocol::Answer answer;
    answer.outcome = outcome;
    if (outcome == protocol::Outcome::error) {
        answer.error = response.dictionary()->text("error");
        answer.message = response.dictionary()->text("message");
    }
    if (form == BodyForm::propertyList) {
        if (auto text = xmlPropertyList(response)) {
            answer.form = form;
            answer.bytes = *std::move(text);
            return answer;
        }
    }
    answer.form = BodyForm::json;
    answer.bytes = jsonOf(response) + '\n';
    return answer;
}

protocol::Answer errorAnswer(std::string_view code, std::string_view message, BodyForm form) {
    return written(protocol::Outcome::error, Dictionary{{"error", code}, {"message", message}}, form);
}

}  // namespace adminhost
