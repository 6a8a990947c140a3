#include <cstdlib>

namespace {

/// These tests compare the texts of dates in this zone, however the program is started.
const bool zoneIsSet = ::setenv("TZ", "Europe/Berlin", 1) == 0;

}  // namespace
