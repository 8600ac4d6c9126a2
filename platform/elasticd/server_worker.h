// What one thread of the server does with a connection that is ready.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "connection_table.h"
#include "server.h"

namespace quarrox::elasticd {

// Not thread-safe: one object a thread. Every call hands the connection back to the table.
class Worker {
 public:
  struct Shared {
    ConnectionTable& table;
    const Server::Handler& handler;
    const Server::Refuse& refuse;
    const std::string& spool_directory;
    size_t longest_request = SIZE_MAX;
    bool logs_refusals = true;
    std::atomic<size_t> unread = 0;  // memory of the answers that wait to be read
  };

  // `make_way` is called before what may take long.
  Worker(Shared& shared, std::function<void()> make_way);

  // Goes on with what the connection waited for, as far as that can be done without waiting.
  void Serve(Connection& connection);

  // A client that has its first answer usually closes at once. Such a connection stays with this thread for a moment
  // instead of being waited for by all of them. SettleLingering() is to be called soon, at the next event.
  bool lingers() const { return lingering_ != nullptr; }
  void SettleLingering();

  // Answers with a refusal, and lets the client finish what it writes: closing at once would fail its writing, and it
  // might never look at the answer. Logged.
  void Refuse(Connection& connection, const std::string& reason);

  // The same, for a client that asked for nothing; not logged.
  void TurnAway(Connection& connection, const std::string& reason);

  // Writes a refusal to a socket that is closed next.
  void SendRefusal(int socket, const std::string& reason);

 private:
  void LogRefusal(const std::string& reason) const;
  void Read(Connection& connection);
  bool ComesSoon(const Connection& connection) const;
  void Drain(Connection& connection);
  void SendOn(Connection& connection);
  bool Consume(Connection& connection, std::string_view data);
  bool CarryOut(Connection& connection, std::string_view rest);
  bool SendAnswer(Connection& connection, std::string_view rest);
  void LeaveUnread(Connection& connection, const AnswerSender& sender);
  void AwaitRequest(Connection& connection);
  void End(Connection& connection);
  void Linger(Connection& connection);

  Shared& shared_;
  ConnectionTable& table_;
  const std::function<void()> make_way_;
  std::unique_ptr<Answer> answer_;
  Connection* lingering_ = nullptr;
  char buffer_[ConnectionTable::kChunk];
};

}  // namespace quarrox::elasticd
