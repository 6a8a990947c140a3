#include "platform/framework/Report.h"

namespace adminhost {
namespace {

ReportSink* theSink = nullptr;

}  // namespace

void setReportSink(ReportSink* sink) noexcept {
    theSink = sink;
}

void reportChange(Change change) {
    if (theSink != nullptr) {
        theSink->changed(std::move(change));
    }
}

void announceSecret(const SecretPart& part) {
    if (theSink != nullptr) {
        theSink->becomesSecret(part);
    }
}

void announceReading() {
    if (theSink != nullptr) {
        theSink->readingBegins();
    }
}

void reportNotDone(NotDone part) {
    if (theSink != nullptr) {
        theSink->notDone(std::move(part));
    }
}

}  // namespace adminhost
