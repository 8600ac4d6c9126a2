#include "operation_handler.h"

#include <syslog.h>

#include <sstream>

namespace quarrox::fileindexd {
namespace {

class LoggingHandler final : public OperationHandler {
 public:
  explicit LoggingHandler(const std::string& share) : share_(share) {}

  void Handle(const fileindex::OP& operation) override {
    ++count_;
    std::ostringstream text;
    text << operation;
    // Cut, because the system log drops a line that is too long for one datagram.
    syslog(LOG_INFO, "%.8192s", text.str().c_str());
  }

  void Commit() override {
    syslog(LOG_INFO, "%zu operations of share %s", count_, share_.c_str());
    count_ = 0;
  }

 private:
  const std::string share_;
  size_t count_ = 0;
};

}  // namespace

std::unique_ptr<OperationHandler> MakeLoggingHandler(const std::string& share) {
  return std::make_unique<LoggingHandler>(share);
}

}  // namespace quarrox::fileindexd
