// Where users who may not command the search engine ask it.
#pragma once

#include <cstdint>

namespace quarrox {

// Takes "document_get_by_query" of everybody, as whoever asks: nothing in an answer speaks of what they may not read.
inline constexpr char kSearchSocketPath[] = "/var/run/vexosearch.sock";

// How far into the hits a search there may reach.
inline constexpr uint64_t kMostHitsOfUsers = 10000;

}  // namespace quarrox
