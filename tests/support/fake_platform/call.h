// The frame in which every call of the machine in memory is made.
#pragma once

#include <string>
#include <type_traits>
#include <vector>

#include "support/fake_platform/fake_platform.h"

// Defines a call of the seam: it is logged with the arguments that come last and answers, or fails as a test wants it
// or with the error that the answer throws. Most calls are an int and fail with -1.
#define CALL(type, function, parameters, failed, answer, ...)                      \
  type function parameters {                                                       \
    return Answer<type>(                                                           \
        #function, {__VA_ARGS__}, [&] { return answer; }, [&] { return failed; }); \
  }
#define INT(function, parameters, answer, ...) CALL(int, function, parameters, -1, answer, __VA_ARGS__)
#define PLAIN(type, function, parameters, answer) \
  type function parameters {                      \
    return answer;                                \
  }

namespace quarrox::support {

template <typename Result, typename Answered, typename Failed>
Result Answer(const char* function, const std::vector<std::string>& arguments, Answered answer, Failed failed) {
  try {
    FakePlatform::Get().Begin(function, arguments);
    return answer();
  } catch (int error) {
    VLIBCErrSet(error);
    return failed();
  }
}

template <typename T>
int Give(T* place, std::type_identity_t<T> value, int result = 0) {
  *place = value;
  return result;
}

inline int Put(const std::string& text, char* buffer, size_t size) {
  if (text.size() >= size) throw int{VEXO_ERR_BUFFER_TOO_SMALL};
  return Give(buffer + text.copy(buffer, size), '\0');
}

}  // namespace quarrox::support
