#include "user_searches.h"

#include "common/error.h"
#include "error_code.h"

namespace quarrox::elasticd {
namespace {

// Searches in an index go one by one, so that more of one user would only hold up the others.
constexpr int kMostOfOne = 2;
constexpr int kMostOfAll = 32;

// What is not read waits on the disk: a page of hits is far less, and the longest list of them some megabytes.
constexpr uint64_t kLongestAnswer = uint64_t{8} << 20;

}  // namespace

// Counts a search while it runs. Throws Error 1401 where there are too many.
class UserSearches::Turn {
 public:
  Turn(UserSearches& searches, uid_t user) : searches_(searches), user_(user) {
    const std::lock_guard lock(searches_.mutex_);
    const auto own = searches_.running_.find(user_);
    if (own != searches_.running_.end() && own->second >= kMostOfOne) {
      throw Error(kTooManyRequests, "So many searches of this user run already; ask again when one has ended");
    }
    if (searches_.all_ >= kMostOfAll) throw Error(kTooManyRequests, "Too many searches run; ask again later");
    ++searches_.running_[user_];
    ++searches_.all_;
  }
  ~Turn() {
    const std::lock_guard lock(searches_.mutex_);
    --searches_.all_;
    if (--searches_.running_[user_] == 0) searches_.running_.erase(user_);
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
