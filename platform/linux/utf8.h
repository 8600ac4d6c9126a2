// UTF-8, judged by Unicode's own rules: nothing overlong, no surrogates.
#pragma once

#include <string_view>

namespace platform {

// Whether a text is UTF-8; zero bytes are. Texts of 2 GiB and more are none. Thread-safe.
bool IsUtf8(std::string_view text);

}  // namespace platform
