#include "user_searches.h"

#include <chrono>

#include "common/error.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// Of different users, each of which costs a thread.
constexpr size_t kMostOfAll = 32;

// How long a user's search waits for another one of the same user: in an index they go one by one, so that more of one
// user at a time would only hold up the others.
constexpr std::chrono::seconds kPatience(15);

// What is not read waits on the disk: a page of hits is far less, and the longest list of them some megabytes.
constexpr uint64_t kLongestAnswer = uint64_t{8} << 20;

}  // namespace

// Counts a search while it runs. Waits for another one of the same user; throws Error 1401 where that takes too long,
// or there are too many.
class UserSearches::Turn {
 public:
  Turn(UserSearches& searches, uid_t user) : searches_(searches), user_(user) {
    std::unique_lock lock(searches_.mutex_);
    const auto is_free = [&] { return !searches_.running_.contains(user_); };
    if (!searches_.ended_.wait_for(lock, kPatience, is_free)) {
      throw Error(kTooManyRequests, "Another search of this user runs; ask again when it has ended");
    }
    if (searches_.running_.size() >= kMostOfAll)
      throw Error(kTooManyRequests, "Too many searches run; ask again later");
    searches_.running_.insert(user_);
  }
  ~Turn() {
    const std::lock_guard lock(searches_.mutex_);
    searches_.running_.erase(user_);
    searches_.ended_.notify_all();
  }
  Turn(const Turn&) = delete;
  Turn& operator=(const Turn&) = delete;

 private:
  UserSearches& searches_;
  const uid_t user_;
};

void UserSearches::Handle(int client, const std::string& request, Answer& answer) {
  answer.Limit(kLongestAnswer);
  try {
    const std::optional<Identity> user = IdentityOfPeer(client);
    if (!user) throw Error(kInputOutput, "The system does not tell who asks");
    const Turn turn(*this, user->user);
    engine_.HandleSearch(*user, request, answer);
  } catch (const Error& error) {
    answer.Clear();
    answer.Append(Engine::Refusal(error.code, error.reason));
  }
}

}  // namespace quarrox::elasticd
