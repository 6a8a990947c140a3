#include "adminhostd/Protocol.h"

#include <gtest/gtest.h>

namespace adminhost::protocol {
namespace {

using namespace std::chrono_literals;

// No member of a sample has its default value, so that a member that is not transmitted is noticed.

Perform perform() {
    return {.request = "1-2",
            .plugin = "p",
            .command = "c",
            .caller = {7, 8, 9, "u.scope"},
            .received = Date(90s),
            .arguments = Dictionary{{"a", Array{Value(1), Value(Dictionary{{"b", 2.5}})}}},
            .revisions = {"r1", ""},
            .showsRevision = true,
            .keepsHistory = true,
            .checkOnly = true,
            .milliseconds = 300'000,
            .form = BodyForm::propertyList};
}

DirectoryNodeOptions node() {
    DirectoryNodeOptions node;
    node.local = true;
    node.places = {{"", "file, line 1"}, {"base", ""}};
    node.settings = {.name = "/N",
                     .uris = {"ldap://a", "ldapi://b"},
                     .base = "b",
                     .userBase = "ub",
                     .groupBase = "gb",
                     .userFilter = "(u=*)",
                     .groupFilter = "(g=*)",
                     .bindDn = "dn",
                     .bindPasswordFile = HostPath("/p"),
                     .bindPasswordCredential = "c",
                     .credentialsDirectory = std::nullopt,
                     .sasl = LdapNodeSettings::Sasl::gssapi,
                     .certFile = HostPath("/cert"),
                     .keyFile = HostPath("/key"),
                     .keytab = HostPath("/keytab"),
                     .principal = "p",
                     .startTls = true,
                     .caFile = HostPath("/ca"),
                     .verify = LdapNodeSettings::Verify::never,
                     .schema = LdapNodeSettings::Schema::ad,
                     .uuidForm = LdapNodeSettings::UuidForm::guid,
                     .kerberosRealm = "R",
                     .userMap = {{"UniqueID", "n"}},
                     .groupMap = {{"RecordName", "cn"}},
                     .timeout = 7s,
                     .createBase = "cb",
                     .objectClasses = {"o"},
                     .createAttributes = {{"gecos", {"%u", "x"}}, {"empty", {}}}};
    return node;
}

std::vector<ToWorker> messagesToWorker() {
    return {Configure{.build = "b",
                      .root = "/r",
                      .accountUuids = "/u",
                      .serviceManager = ServiceManager::pidFile,
                      .plugins = {"/a.so", "/b.so"},
                      .refused = {{"/c.so", "reason"}},
                      .languages = {"de"},
                      .toolEnvironment = {{"A", "1"}, {"B", ""}},
                      .directory = {node(), {}},
                      .directoryMilliseconds = 9,
                      .frontAccount = 8,
                      .tryOnly = true,
                      .probeDirectory = true},
            perform(),
            FindAccounts{"ma", "is", BodyForm::propertyList},
            ReadHistory{"p", BodyForm::propertyList},
            Diagnose{7},
            ReadLog{"p", "n", 1, 2, 3, BodyForm::propertyList},
            ReadAudit{1, "u", "k", "a", 3, BodyForm::propertyList},
            Proceed{"r"},
            Recorded{"r"}};
}

Answer answer(Outcome outcome) {
    return {.outcome = outcome,
            .error = "CODE",
            .message = "A sentence.",
            .findings = {{"a.0", "is bad", "leave it out"}, {"b", "", ""}},
            .checks = {{Diagnosis::Health::ok, "n", "f", ""},
                       {Diagnosis::Health::warning, "o", "f", "fix"},
                       {Diagnosis::Health::failure, "p", "", "fix"}},
            .revision = "r2",
            .form = BodyForm::propertyList,
            .bytes = "<plist/>",
            .toolRuns = 3,
            .directoryLookups = 4,
            .residentBytes = 5};
}

std::vector<ToFront> messagesToFront() {
    std::vector<ToFront> messages{
        Hello{.plugins =
                  {{.name = "p",
                    .version = "1",
                    .file = "/p.so",
                    .commands = {{"c", Access::control, true, true, {"n"}, 5s, false, Dictionary{{"summary", "s"}}},
                                 {"d", Access::read, {}, {}, {}, {}, true, {}},
                                 {"e", Access::write, {}, {}, {}, {}, true, {}},
                                 {"f", Access::account, {}, {}, {}, {}, true, {}}}}},
              .refused = {{"/q.so", "why"}},
              .problems = {"none", ""}},
        Hello{},
        Log{"an event"},
        Change{"cameras", "U", "Studio", "users", Value(1), Value("b"), true, Dictionary{{"k", 1}}, true},
        Change{"settings", "", "", "k", {}, {}, false, {}},
        NotDone{"configuration.a", "why", "words"},
        SecretPart{"properties", "3", "value"},
        Begun{"r", "anna", "eva", "disk full"},
        Unfinished{"r",
                   "p",
                   "c",
                   Access::write,
                   {7, 8, 9, "u.scope"},
                   "anna",
                   "eva",
                   {Change{"settings", "", "", "port", Value(1), Value(2), false, {}, false}},
                   {NotDone{"configuration.a", "why", "words"}},
                   "its end"}};
    for (const Outcome outcome : outcomes()) {
        messages.emplace_back(answer(outcome));
    }
    return messages;
}

std::string bytesOf(const Frame& frame) {
    return *encodeFrame(frame) + frame.bytes;
}

std::optional<Frame> frameFrom(std::string_view bytes) {
    FrameReader reader;
    reader.append(bytes);
    return reader.next();
}

TEST(Protocol, MessageToTheWorkerArrivesWithEveryMember) {
    for (const ToWorker& message : messagesToWorker()) {
        const auto read = toWorker(*frameFrom(bytesOf(frameOf(message))));
        ASSERT_TRUE(read) << read.error().description.value_or("");
        EXPECT_TRUE(*read == message) << message.index();
    }
}

TEST(Protocol, MessageToTheFrontArrivesWithEveryMember) {
    for (const ToFront& message : messagesToFront()) {
        const auto read = toFront(*frameFrom(bytesOf(frameOf(message))));
        ASSERT_TRUE(read) << read.error().description.value_or("");
        EXPECT_TRUE(*read == message) << message.index();
    }
}

TEST(Protocol, MessageForTheOtherSideIsAnError) {
    for (const ToWorker& message : messagesToWorker()) {
        EXPECT_FALSE(toFront(frameOf(message)));
    }
    for (const ToFront& message : messagesToFront()) {
        EXPECT_FALSE(toWorker(frameOf(message)));
    }
}

/// Calls the function with the payload of every message, and with faulty forms of each payload.
template <class Decode>
void spoilEveryMember(const auto& messages, Decode decode) {
    for (const auto& message : messages) {
        const Frame frame = frameOf(message);
        Frame surplus = frame;
        surplus.payload.dictionary()->set("surplus", 1);
        EXPECT_FALSE(decode(surplus)) << message.index();
        for (const Value& other : {Value(), Value("text"), Value(Array{})}) {
            EXPECT_FALSE(decode({frame.type, other, {}})) << message.index();
        }
        for (const DictionaryEntry& entry : *frame.payload.dictionary()) {
            Frame missing = frame;
            missing.payload.dictionary()->remove(entry.key);
            Frame wrong = frame;
            wrong.payload.dictionary()->set(entry.key, Value(Data{1}));
            const bool isAnyValue =
                entry.key.ends_with(".from") || entry.key.ends_with(".to") || entry.key.ends_with(".undo");
            const bool mayBeAbsent = isAnyValue || entry.key.ends_with(".serviceManager");
            EXPECT_EQ(decode(missing).has_value(), mayBeAbsent) << entry.key;
            EXPECT_EQ(decode(wrong).has_value(), isAnyValue) << entry.key;
        }
    }
}

TEST(Protocol, MissingSurplusOrWrongMemberIsAnError) {
    spoilEveryMember(messagesToWorker(), toWorker);
    spoilEveryMember(messagesToFront(), toFront);
}

TEST(Protocol, BytesBehindAMessageThatHasNoneAreAnError) {
    Frame frame = frameOf(Log{"an event"});
    frame.bytes = "x";
    const auto read = toFront(frame);
    ASSERT_FALSE(read);
    EXPECT_EQ(read.error().description, "bytes follow a message that has none");
}

TEST(Protocol, UnknownWordIsAnError) {
    Frame frame = frameOf(answer(Outcome::answered));
    for (const DictionaryEntry& entry : Dictionary(*frame.payload.dictionary())) {
        if (entry.value == Value("answered")) {
            frame.payload.dictionary()->set(entry.key, "Answered");
        }
    }
    const auto read = toFront(frame);
    ASSERT_FALSE(read);
    EXPECT_NE(read.error().description->find("is missing or wrong"), std::string::npos);
}

TEST(Protocol, UnknownServiceManagerIsAnError) {
    Configure configuration;
    configuration.serviceManager = ServiceManager::systemd;
    Frame frame = frameOf(configuration);
    EXPECT_TRUE(toWorker(frame));
    for (const DictionaryEntry& entry : Dictionary(*frame.payload.dictionary())) {
        if (entry.value == Value("systemd")) {
            frame.payload.dictionary()->set(entry.key, "another");
        }
    }
    EXPECT_FALSE(toWorker(frame));
}

TEST(Protocol, NumberOutsideTheRangeOfItsMemberIsAnError) {
    for (const Value& number : {Value(-1), Value(std::int64_t{1} << 40)}) {
        Frame frame = frameOf(perform());
        for (const DictionaryEntry& entry : Dictionary(*frame.payload.dictionary())) {
            const Dictionary* caller = entry.value.dictionary();
            if (caller != nullptr && caller->size() == 4) {
                Dictionary changed;
                for (const DictionaryEntry& one : *caller) {
                    changed.set(one.key, number);
                }
                frame.payload.dictionary()->set(entry.key, changed);
            }
        }
        EXPECT_FALSE(toWorker(frame));
    }
}

TEST(Protocol, RefusalWithoutFindingsIsAnError) {
    Answer refused = answer(Outcome::refused);
    refused.findings.clear();
    EXPECT_FALSE(toFront(frameOf(refused)));
}

/// Changes each bit. A message that is still accepted must be valid: encoding and decoding returns the same message.
template <class Decode>
void changeEveryBit(const auto& messages, Decode decode) {
    for (const auto& message : messages) {
        const std::string bytes = bytesOf(frameOf(message));
        for (std::size_t bit = 0; bit < bytes.size() * 8; ++bit) {
            std::string changed = bytes;
            changed[bit / 8] = static_cast<char>(changed[bit / 8] ^ (1 << (bit % 8)));
            auto frame = frameFrom(changed);
            if (!frame) {
                continue;
            }
            const auto read = decode(std::move(*frame));
            if (read) {
                const std::string once = bytesOf(frameOf(*read));
                const auto again = decode(*frameFrom(once));
                ASSERT_TRUE(again) << "message " << message.index() << ", bit " << bit;
                EXPECT_EQ(bytesOf(frameOf(*again)), once) << "message " << message.index() << ", bit " << bit;
            }
        }
    }
}

TEST(Protocol, EachSingleBitChangeIsRejectedOrIsAnotherValidMessage) {
    changeEveryBit(messagesToWorker(), toWorker);
    changeEveryBit(messagesToFront(), toFront);
}

}  // namespace
}  // namespace adminhost::protocol
