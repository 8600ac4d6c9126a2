// What a failing call throws.
#pragma once

#include <string>

#include <gtest/gtest.h>

#include "common/error.h"

namespace quarrox::support {

// The reason of the Error with this code that `call` throws; "" when it throws none.
template <typename Call>
std::string ReasonOf(int code, const Call& call) {
  try {
    call();
  } catch (const Error& error) {
    EXPECT_EQ(error.code, code);
    return error.reason;
  }
  return "";
}

}  // namespace quarrox::support
