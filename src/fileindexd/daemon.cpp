#include "daemon.h"

#include <poll.h>
#include <signal.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <utility>
#include <vector>

#include <systemd/sd-daemon.h>

#include "common/error.h"
#include "common/log.h"
#include "common/watchdog.h"
#include "fileindex/folder_mgr.h"

namespace quarrox::fileindexd {

// SIGUSR1 means nothing here; it is blocked for the workers, which inherit that.
Daemon::Daemon(const std::string& socket_path, std::vector<std::string> worker_options)
    : signals_({SIGTERM, SIGINT, SIGCHLD, SIGUSR1}),
      socket_(socket_path),
      pool_(std::move(worker_options)),
      folders_(fileindex::kFileIndexFoldersCfgPath) {}

void Daemon::TakeSignals() {
  for (int signal; (signal = signals_.Take()) != 0;) {
    if ((signal != SIGTERM && signal != SIGINT) || stop_at_ != kNever) continue;
    sd_notify(0, "STOPPING=1");
    socket_.Close();
    pool_.EndAll();
    look_at_ = kNever;
    stop_at_ = Clock::now() + kTimeToStop;
  }
  pool_.Reap();
}

// A paused share gets no worker by itself, and one that is running is not taken away: pausing a share deletes its
// worker before it marks the folders, and resuming it creates the worker before it unmarks them, of which it is told.
void Daemon::FollowFolders() {
  const auto& shares = indexed_.shares();
  for (const auto& [name, share] : shares) {
    const auto order = orders_.find(name);
    if (order == orders_.end() ? share.is_served : order->second) pool_.Start(name);
    if (share.paused != std::exchange(paused_[name], share.paused)) pool_.Tell(name);
  }
  std::erase_if(paused_, [&](const auto& paused) { return shares.count(paused.first) == 0; });
  for (const std::string& share : pool_.Shares()) {
    if (shares.count(share) == 0) pool_.End(share);
  }
}

// Without it, commands still tell of most changes.
void Daemon::WatchFolders() {
  try {
    folders_.Arm();
  } catch (const Error& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("The list of folders cannot be watched, reason: %s", error.reason.c_str());
  }
}

void Daemon::LookAtFolders() {
  WatchFolders();
  try {
    if (indexed_.Refresh()) FollowFolders();
    look_at_ = kNever;
    look_backoff_.Reset();
    std::erase_if(orders_, [this](const auto& order) { return indexed_.shares().count(order.first) == 0; });
  } catch (const std::exception& error) {
    errno = 0;
    QUARROX_LOG_FAILURE("The workers stay as they are because the folders cannot be read, reason: %s", error.what());
    look_at_ = Clock::now() + look_backoff_.Next();
  }
}

void Daemon::Order(const std::string& share, bool run) {
  orders_[share] = run;
  LookAtFolders();
  if (!run) {
    pool_.End(share);
  } else if (indexed_.shares().count(share) != 0) {
    pool_.Start(share);
    pool_.Tell(share);
  }
}

void Daemon::CarryOut(const Command& command) {
  switch (command.type) {
    case Command::kWorkerCreate:
      return Order(command.share, true);
    case Command::kWorkerDelete:
      return Order(command.share, false);
    case Command::kSettingChanged:
      LookAtFolders();
      if (!pool_.Has(command.share)) return;
      pool_.Start(command.share);
      return pool_.Tell(command.share);
    case Command::kPauseChanged:
      return pool_.TellAll();
  }
}

// Clients are answered first, all of them.
void Daemon::RunOnce() {
  pollfd fds[2 + QueueWatch::kPollFds] = {{signals_.fd(), POLLIN, 0}, {socket_.fd(), POLLIN, 0}};
  folders_.FillPollFds(fds + 2);
  Watchdog& watchdog = Watchdog::OfProcess();
  PollUntil(fds, std::size(fds), std::min({socket_.Deadline(), pool_.Deadline(), look_at_, stop_at_, watchdog.due()}));
  watchdog.Alive();
  TakeSignals();
  if (stop_at_ == kNever) {
    std::vector<Command> commands;
    socket_.Process(commands);
    for (const Command& command : commands) CarryOut(command);
  }
  if (folders_.Reported(fds + 2) && stop_at_ == kNever) look_at_ = Clock::now();
  if (look_at_ <= Clock::now()) LookAtFolders();
  pool_.KeepUp();
}

void Daemon::Run() {
  sd_notify(0, "READY=1");  // the socket listens
  do RunOnce();
  while (stop_at_ == kNever || (!pool_.empty() && Clock::now() < stop_at_));
}

}  // namespace quarrox::fileindexd
