// What the analyzers other than plain "vexostandard" make of a value; documents and queries share it. Any thread.
#pragma once

#include <functional>
#include <string>
#include <string_view>

#include "mapping.h"

namespace quarrox::elasticd {

using Visitor = std::function<void(std::string_view)>;

// Whether the field's terms are just the words of its text, so that searches in no particular field can ask for them
// under the field's own prefix.
bool HoldsPlainWords(const Field& field);

// Calls `visit` with each word of a value in order, as the field's analyzer sees it, folded where the field wants that.
// The views are gone after the call.
void ForEachWord(const Field& field, std::string_view value, const Visitor& visit);

// The directory without slashes at its end, and each one above it up to "/", the longest last; each fits `room` as a
// keyword does.
void ForEachDirectory(std::string_view path, size_t room, const Visitor& visit);

// The directory itself as one of these.
std::string WholeDirectory(std::string_view path, size_t room);

// The value, or where it is longer than `room`, as much of it as fits before its hash in hexadecimal digits. `kept`
// takes what the result points to in that case.
std::string_view FitKeyword(std::string_view value, size_t room, std::string& kept);

// How many code points an n-gram has.
inline constexpr size_t kNgram = 3;

// Calls `visit` with the code points from each one on, kNgram of them and fewer at the end of the word. A byte that is
// no UTF-8 counts as one. The views are parts of `word`.
void ForEachNgram(std::string_view word, const Visitor& visit);

}  // namespace quarrox::elasticd
