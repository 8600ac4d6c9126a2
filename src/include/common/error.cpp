#include "common/error.h"

namespace quarrox {
namespace {

std::string Compose(ErrorCode code, const std::string& reason) {
  std::string text = "Quarrox error, code=" + std::to_string(static_cast<int32_t>(code));
  if (!reason.empty()) text += ", reason=[" + reason + "]";
  return text;
}

}  // namespace

Error::Error(ErrorCode code) : Error(code, std::string()) {}

Error::Error(ErrorCode code, const std::string& reason)
    : std::runtime_error(Compose(code, reason)), code(code), reason(reason) {}

Error::~Error() = default;

const char* Error::what() const noexcept {
  return reason.c_str();
}

}  // namespace quarrox
