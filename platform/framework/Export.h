#pragma once

// What libadminhost offers. The library is compiled with hidden symbols: plug-ins and programs that link it can use
// only the functions and classes with this mark. A class that is thrown, or derived from on the other side, needs it
// too.

#define ADMINHOST_EXPORT __attribute__((visibility("default")))
