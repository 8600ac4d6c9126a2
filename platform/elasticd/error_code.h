// The codes that the engine answers with.
#pragma once

#include "common/error.h"

namespace quarrox::elasticd {

inline constexpr ErrorCode kIndexOpening{607};
inline constexpr ErrorCode kIndexRecovering{608};
inline constexpr ErrorCode kNoSuchIndex{609};
inline constexpr ErrorCode kIndexPaused{610};
inline constexpr ErrorCode kIndexExists{611};
inline constexpr ErrorCode kBadArgument{612};
inline constexpr ErrorCode kBadQuery{613};
inline constexpr ErrorCode kNoSuchDocument{614};
inline constexpr ErrorCode kUnknownCommand{615};
inline constexpr ErrorCode kMalformedRequest{616};
inline constexpr ErrorCode kInputOutput{617};
inline constexpr ErrorCode kNoRoom{618};
inline constexpr ErrorCode kOutOfMemory{1400};
inline constexpr ErrorCode kTooManyRequests{1401};

}  // namespace quarrox::elasticd
