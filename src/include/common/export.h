// The export macro of libfileindex. The library is built with hidden visibility: only what bears this macro is
// part of its binary interface.
#pragma once

#define QUARROX_API __attribute__((visibility("default")))
