// Connections of the machine in memory: a search engine that answers what a test wants.
#include "support/fake_platform/call.h"
#include "vexo/socket.h"

using namespace quarrox::support;

namespace vexodaemon {

static bool Say(std::string& text) {
  auto& answers = FakePlatform::Get().engine_answers;
  text = answers.empty() ? R"({"success":true})" : answers.front();
  if (!answers.empty()) answers.pop_front();
  return true;
}

SockConnection::~SockConnection() = default;
DomainSockConnection::DomainSockConnection(const std::string& path) : path_(path) {}
CALL(bool, DomainSockConnection::Connect, (long timeout), false, true, path_, std::to_string(timeout))
CALL(bool, SockConnection::Send, (const std::string& text), false,
     (FakePlatform::Get().engine_requests.push_back(text), true), text)
CALL(bool, SockConnection::Recv, (std::string & text), false, Say(text))

}  // namespace vexodaemon
