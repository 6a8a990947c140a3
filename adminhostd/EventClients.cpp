#include "adminhostd/EventClients.h"

#include "adminhostd/FrontAnswers.h"
#include "adminhostd/RequestBody.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <utility>

namespace adminhost {

void EventClients::serve(Exchange& exchange, bool all) {
    const std::string_view argument = exchange.argument("after");
    const auto after = numberOf(argument);
    const std::string epoch(exchange.argument("epoch"));
    if (!after || !isUtf8(epoch)) {
        exchange.answer(errorAnswer(400, "MALFORMED_ADDRESS", "The argument \"after\" must be a decimal number."));
        return;
    }
    const Client client{&exchange, *after, epoch, all, Clock::now() + patience};
    if (argument.empty() || _stopping || !_ring.isCurrent(*after, epoch)) {
        exchange.answer(
            {200, _ring.since(argument.empty() ? std::nullopt : after, epoch, exchange.peer().uid, all), {}});
        return;
    }
    if (full(exchange.peer().uid)) {
        dropAbandoned();
    }
    if (full(exchange.peer().uid)) {
        exchange.answer(retryLater("TOO_MANY_WAITING", "Too many clients wait for events already."));
        return;
    }
    _clients.push_back(client);
}

bool EventClients::full(uid_t uid) const {
    const auto own = std::count_if(_clients.begin(), _clients.end(),
                                   [&](const Client& client) { return client.exchange->peer().uid == uid; });
    return _clients.size() >= maximum || (uid != 0 && static_cast<std::size_t>(own) >= maximumOfAccount);
}

void EventClients::dropAbandoned() {
    _clients.remove_if([&](const Client& client) {
        const bool gone = client.exchange->clientGone();
        if (gone) {
            answer(client);
        }
        return gone;
    });
}

void EventClients::answer(const Client& client) const {
    client.exchange->answer(
        {200, _ring.since(client.after, client.epoch, client.exchange->peer().uid, client.all), {}});
}

void EventClients::answerAll() {
    for (const Client& client : std::exchange(_clients, {})) {
        answer(client);
    }
}

void EventClients::add(const RequestRecord& record) {
    _ring.add(record);
    answerAll();
}

std::optional<EventClients::Clock::time_point> EventClients::due() const {
    return _clients.empty() ? std::nullopt : std::optional(_clients.front().until);
}

void EventClients::run() {
    const auto now = Clock::now();
    while (!_clients.empty() && now >= _clients.front().until) {
        const Client client = std::move(_clients.front());
        _clients.pop_front();
        answer(client);
    }
}

void EventClients::stop() {
    _stopping = true;
    answerAll();
}

}  // namespace adminhost
