#include <poll.h>
#include <sys/inotify.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <iostream>
#include <map>
#include <thread>
#include <tuple>

#include "command.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "output.h"
#include "status.h"

namespace quarrox::ctl {
namespace {

using Clock = std::chrono::steady_clock;
using State = ShareStatus::State;

constexpr std::chrono::milliseconds kFrame(250);         // between two looks, at least
constexpr std::chrono::milliseconds kLongestWait(1000);  // and at most
constexpr std::chrono::seconds kLineEvery(1);            // of one share, while only its numbers change
constexpr int64_t kPatience = 60;                        // seconds, with a share that waits

// Waits for a worker to tell something. What is not heard is seen at the next look all the same.
class ProgressWatch {
 public:
  void Arm(const IndexingStatus& status) const {
    for (const ShareStatus& share : status.shares) {
      if (share.progress_file.empty()) continue;
      inotify_add_watch(inotify_.get(), Dirname(share.progress_file).c_str(), IN_MOVED_TO | IN_ONLYDIR);
    }
  }

  void Wait() const {
    const Clock::time_point begin = Clock::now();
    pollfd fd = {inotify_.get(), POLLIN, 0};
    poll(&fd, 1, kLongestWait.count());
    std::this_thread::sleep_until(begin + kFrame);
    char events[16384];
    while (read(inotify_.get(), events, sizeof(events)) > 0) {
    }
  }

 private:
  UniqueFd inotify_{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
};

size_t TerminalHeight() {
  winsize size = {};
  return ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_row > 0 ? size.ws_row : 24;
}

// One block of lines on a terminal, drawn anew in its place.
class Block {
 public:
  void Show(const IndexingStatus& status) {
    std::vector<const ShareStatus*> shares;
    size_t width = 0;
    for (const ShareStatus& share : status.shares) {
      shares.push_back(&share);
      width = std::max(width, Visible(share.name).size());
    }
    std::vector<std::string> lines = status.problems;
    if (shares.empty()) lines.emplace_back("no folder is indexed");
    const size_t taken = lines.size() + 2;  // with the line of the cursor, and one that says how many more there are
    const size_t room = std::max<size_t>(TerminalHeight(), taken + 1) - taken;
    if (shares.size() > room) {
      std::stable_partition(shares.begin(), shares.end(), [](const ShareStatus* share) { return share->IsBusy(); });
    }
    for (size_t i = 0; i < std::min(room, shares.size()); ++i) {
      std::string name = Visible(shares[i]->name);
      name.resize(width + 2, ' ');
      lines.push_back(name + Visible(DescribeLong(*shares[i], true)));
    }
    if (shares.size() > room) lines.push_back("and " + std::to_string(shares.size() - room) + " more");
    Draw(lines);
  }

 private:
  // Without wrapping, which would make two lines of one: the terminal cuts off what is too long.
  void Draw(const std::vector<std::string>& lines) {
    std::string text = "\x1b[?7l";
    if (drawn_ > 0) text += "\x1b[" + std::to_string(drawn_) + "A";
    for (const std::string& line : lines) text += '\r' + line + "\x1b[K\n";
    std::cout << text << "\x1b[J\x1b[?7h" << std::flush;
    drawn_ = lines.size();
  }

  size_t drawn_ = 0;
};

// Lines one below the other: one for each change, but of numbers only one a second.
class Log {
 public:
  explicit Log(bool json) : json_(json) {}

  void Show(const IndexingStatus& status) {
    if (status.problems != problems_) {
      for (const std::string& problem : status.problems) std::cerr << "fileindexctl: " << problem << '\n';
      problems_ = status.problems;
    }
    for (const ShareStatus& share : status.shares) Show(share);
    std::cout.flush();
  }

 private:
  using Numbers = std::tuple<uint64_t, uint64_t, std::optional<uint64_t>, std::optional<uint64_t>>;
  struct Shown {
    std::optional<State> state = {};
    std::string reason = {};
    Numbers numbers = {};
    Clock::time_point time = {};
  };

  void Show(const ShareStatus& share) {
    Shown& last = shown_[share.name];
    const Numbers numbers(share.progress.done, share.progress.failed, share.progress.left, share.documents);
    const Clock::time_point now = Clock::now();
    const bool is_other = last.state != share.state || last.reason != share.reason;
    if (!is_other && (last.numbers == numbers || now - last.time < kLineEvery)) return;
    last = {share.state, share.reason, numbers, now};
    std::cout << (json_ ? AsJson(share) : Visible(share.name) + ": " + Visible(DescribeLong(share, false))) << '\n';
  }

  const bool json_;
  std::vector<std::string> problems_;
  std::map<std::string, Shown> shown_;
};

// Since when shares wait, over all of their tries until a pass ends well.
class Waits {
 public:
  // A share that has waited for too long; null where there is none.
  const ShareStatus* Take(const IndexingStatus& status) {
    const int64_t now = time(nullptr);
    const ShareStatus* found = nullptr;
    for (const ShareStatus& share : status.shares) {
      const auto known = waits_.find(share.name);
      const bool is_over = share.state == State::kCurrent ||
                           (known != waits_.end() && known->second.committed != share.progress.committed);
      if (is_over && known != waits_.end()) waits_.erase(known);
      if (share.state != State::kWaiting) continue;
      const int64_t since = share.progress.since != 0 ? share.progress.since : now;
      const Wait& wait = waits_.try_emplace(share.name, Wait{since, share.progress.committed}).first->second;
      if (now - wait.since > kPatience) found = &share;
    }
    return found;
  }

 private:
  struct Wait {
    int64_t since;
    int64_t committed;
  };
  std::map<std::string, Wait> waits_;
};

template <typename View>
int Follow(View view, bool until_idle) {
  const ProgressWatch watch;
  Waits waits;
  for (;; watch.Wait()) {
    const IndexingStatus status = LookAtIndexing(false);
    watch.Arm(status);
    view.Show(status);
    if (!std::cout) return kDone;
    if (!until_idle) continue;
    if (const ShareStatus* waiting = waits.Take(status)) {
      std::cerr << "fileindexctl: " << Visible(waiting->name) << " has been waiting for over a minute\n";
      return kFailed;
    }
    const auto& shares = status.shares;
    if (std::none_of(shares.begin(), shares.end(), [](const ShareStatus& s) { return s.IsBusy(); })) return kDone;
  }
}

}  // namespace

int FollowStatus(bool until_idle, bool json) {
  const bool is_terminal = isatty(STDOUT_FILENO) == 1 && !json;
  return is_terminal ? Follow(Block(), until_idle) : Follow(Log(json), until_idle);
}

}  // namespace quarrox::ctl
