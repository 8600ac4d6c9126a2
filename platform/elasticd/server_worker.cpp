#include "server_worker.h"

#include <poll.h>
#include <sys/socket.h>

#include <cerrno>
#include <new>
#include <utility>

#include "common/error.h"
#include "common/log.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// What answers that wait for their clients may take in memory; further ones go to their files.
constexpr size_t kUnreadInMemory = size_t{32} << 20;

// How long a new client is waited for by the thread that has accepted it.
constexpr int kSoonMilliseconds = 1;

using Parked = ConnectionTable::Parked;

}  // namespace

Worker::Worker(Shared& shared, std::function<void()> make_way)
    : shared_(shared),
      table_(shared.table),
      make_way_(std::move(make_way)),
      answer_(std::make_unique<Answer>(shared.spool_directory)) {}

void Worker::Serve(Connection& connection) {
  switch (connection.stage) {
    case Stage::kSending:
      return SendOn(connection);
    case Stage::kDraining:
      return Drain(connection);
    default:
      return Read(connection);
  }
}

void Worker::Read(Connection& connection) {
  for (;;) {
    const size_t needed = connection.reader.MemoryWith(sizeof(buffer_));
    if (connection.reserved < needed && !table_.Reserve(connection, needed)) return;
    const ssize_t count = recv(connection.fd.get(), buffer_, sizeof(buffer_), MSG_DONTWAIT);
    if (count > 0) {
      const auto size = static_cast<size_t>(count);
      if (!Consume(connection, {buffer_, size})) return;
      if (size < sizeof(buffer_)) return Linger(connection);
      make_way_();
    } else if (count == 0) {
      return End(connection);
    } else if (errno == EAGAIN) {
      if (!ComesSoon(connection)) return AwaitRequest(connection);
    } else if (errno != EINTR) {
      return table_.Release(connection);
    }
  }
}

// Who has connected is about to say why. Where nobody else is there, waiting for that costs less than handing over.
bool Worker::ComesSoon(const Connection& connection) const {
  if (connection.answers != 0 || !connection.reader.empty() || table_.HasSeveral()) return false;
  pollfd ready = {connection.fd.get(), POLLIN, 0};
  return poll(&ready, 1, kSoonMilliseconds) == 1;
}

// One that goes on asking is waited for as any other.
void Worker::Linger(Connection& connection) {
  if (connection.answers != 1 || !connection.reader.empty() || lingering_ != nullptr) return AwaitRequest(connection);
  lingering_ = &connection;
  table_.ExpectToGo(true);
}

// What it asks next is left to whoever waits for it: this thread may have another event at hand.
void Worker::SettleLingering() {
  Connection& connection = *std::exchange(lingering_, nullptr);
  table_.ExpectToGo(false);
  ++connection.answers;
  char byte;
  if (recv(connection.fd.get(), &byte, sizeof(byte), MSG_PEEK | MSG_DONTWAIT) == 0) return End(connection);
  AwaitRequest(connection);
}

// Its client has closed its end, so nothing needs to be drained.
void Worker::End(Connection& connection) {
  if (!connection.reader.empty()) {
    const std::string reason = "The request was cut short";
    LogRefusal(reason);
    SendRefusal(connection.fd.get(), reason);
  }
  table_.Release(connection);
}

// False where the connection was handed back.
bool Worker::Consume(Connection& connection, std::string_view data) {
  try {
    while (!data.empty()) {
      data.remove_prefix(connection.reader.Add(data));
      if (connection.reader.text().size() > shared_.longest_request) {
        throw Error(kMalformedRequest,
                    "The request is longer than " + std::to_string(shared_.longest_request) + " bytes");
      }
      if (connection.reader.whole() && !CarryOut(connection, data)) return false;
    }
    return true;
  } catch (const Error& error) {
    Refuse(connection, error.reason);
  } catch (const std::bad_alloc&) {
    Refuse(connection, "The machine has no memory for the request; send less at a time");
  }
  return false;
}

// False where the connection was handed back, with `rest` for later.
bool Worker::CarryOut(Connection& connection, std::string_view rest) {
  if (table_.HasSeveral()) make_way_();
  if (connection.listed) table_.Unlist(connection);
  answer_->Clear();
  const Server::Rest todo = shared_.handler(connection.fd.get(), connection.reader.text(), *answer_, make_way_);
  const bool goes_on = SendAnswer(connection, rest);
  if (!todo) return goes_on;
  if (!goes_on || table_.HasSeveral()) make_way_();
  todo();
  return goes_on;
}

// False where the connection was handed back, with `rest` for later.
bool Worker::SendAnswer(Connection& connection, std::string_view rest) {
  connection.reader.Clear();
  ++connection.answers;
  if (connection.reserved > ConnectionTable::kChunk) table_.GiveBack(connection);
  AnswerSender sender(*answer_);
  switch (sender.Send(connection.fd.get())) {
    case AnswerSender::Progress::kDone:
      return true;
    case AnswerSender::Progress::kGone:
      table_.Release(connection);
      return false;
    case AnswerSender::Progress::kBlocked:
      connection.leftover = rest;
      LeaveUnread(connection, sender);
      return false;
  }
  return false;
}

void Worker::LeaveUnread(Connection& connection, const AnswerSender& sender) {
  AnswerSender begun = sender;
  try {
    if (shared_.unread + begun.memory() > kUnreadInMemory) begun.Spool();
  } catch (const Error& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("An answer is lost, reason: %s", error.reason.c_str());
    answer_->Clear();
    return table_.Release(connection);
  }
  connection.outgoing = std::make_unique<Outgoing>(std::move(answer_), begun, shared_.unread);
  answer_ = std::make_unique<Answer>(shared_.spool_directory);
  if (table_.Park(connection, Stage::kSending) != Parked::kYes) table_.Release(connection);
}

void Worker::SendOn(Connection& connection) {
  Outgoing& outgoing = *connection.outgoing;
  const AnswerSender::Progress progress = outgoing.sender.Send(connection.fd.get());
  if (progress == AnswerSender::Progress::kGone) return table_.Release(connection);
  if (progress == AnswerSender::Progress::kBlocked) {
    const bool moved = outgoing.sender.sent() > outgoing.seen;
    outgoing.seen = outgoing.sender.sent();
    if (table_.Park(connection, Stage::kSending, moved) != Parked::kYes) table_.Release(connection);
    return;
  }
  connection.outgoing.reset();
  const std::string leftover = std::move(connection.leftover);
  std::string().swap(connection.leftover);
  if (Consume(connection, leftover)) AwaitRequest(connection);
}

void Worker::AwaitRequest(Connection& connection) {
  const bool silent = connection.reader.empty();
  switch (table_.Park(connection, silent ? Stage::kIdle : Stage::kReceiving)) {
    case Parked::kYes:
      return;
    case Parked::kLate:
      if (silent) return TurnAway(connection, "No request arrived in time; connect again to send one");
      return Refuse(connection, "The request did not arrive in time");
    case Parked::kStopping:
      return TurnAway(connection, "The engine is stopping; ask again when it runs");
    case Parked::kFailed:
      return TurnAway(connection, "The machine has no room for another connection; ask again later");
  }
}

void Worker::SendRefusal(int socket, const std::string& reason) {
  answer_->Clear();
  answer_->Append(shared_.refuse(reason));
  // Far smaller than any socket's buffer: what cannot be sent at once has nobody to read it.
  AnswerSender(*answer_).Send(socket);
}

void Worker::LogRefusal(const std::string& reason) const {
  if (!shared_.logs_refusals) return;
  errno = 0;
  QUARROX_LOG_FAILURE("A client is refused, reason: %s", reason.c_str());
}

void Worker::Refuse(Connection& connection, const std::string& reason) {
  LogRefusal(reason);
  TurnAway(connection, reason);
}

void Worker::TurnAway(Connection& connection, const std::string& reason) {
  connection.reader.Clear();
  SendRefusal(connection.fd.get(), reason);
  shutdown(connection.fd.get(), SHUT_WR);
  if (table_.Park(connection, Stage::kDraining) != Parked::kYes) table_.Release(connection);
}

void Worker::Drain(Connection& connection) {
  // A few pieces at a time, so that a client that never stops writing does not hold up others.
  for (int pieces = 0; pieces < 16; ++pieces) {
    const ssize_t count = recv(connection.fd.get(), buffer_, sizeof(buffer_), MSG_DONTWAIT);
    if (count == 0 || (count < 0 && errno != EAGAIN && errno != EINTR)) return table_.Release(connection);
    if (count < 0) break;
  }
  if (table_.Park(connection, Stage::kDraining) != Parked::kYes) table_.Release(connection);
}

}  // namespace quarrox::elasticd
