#pragma once

// The text headers under their former common name.

#include "platform/text/LocalDate.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
