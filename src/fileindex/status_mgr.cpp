#include "fileindex/status_mgr.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <ctime>

#include "common/file.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sdk/credentials.h"
#include "fileindex/communication.h"

namespace quarrox::fileindex {
namespace {

constexpr char kResumeTime[] = "resume_time";
constexpr char kShare[] = "share";

// An optional member; Error 120 where `object` is none.
template <typename T>
T Read(const Json::Value& object, const std::string& key, T value) {
  GetJsonValue(value, object, key, false);
  return value;
}

// The flags of all shares; empty where they are not to be understood. Not copied: who lists folders asks for many.
const Json::Value& SharesOf(const Json::Value& state) {
  static const Json::Value none(Json::objectValue);
  if (!state.isObject()) Read<bool>(state, kShare, false);  // throws
  const Json::Value& shares = state[kShare];
  return shares.isObject() ? shares : none;
}

void ChangeFlags(Json::Value& state, const std::string& share, int set, int clear) {
  Json::Value shares = SharesOf(state);
  shares[share] = (Read(shares, share, 0U) | static_cast<unsigned int>(set)) & ~static_cast<unsigned int>(clear);
  state[kShare] = shares;
}

void ChangeResumeTime(Json::Value& state, int64_t resume_time) {
  Read<Json::Value>(state, kResumeTime, Json::nullValue);  // a state that is no object is not replaced
  state[kResumeTime] = static_cast<Json::Int64>(resume_time);
}

// In 32 bits: a very large number of hours wraps.
int64_t ResumeTime(int hours) {
  if (hours == 0) return kPausedWithoutEnd;
  const auto now = static_cast<uint32_t>(time(nullptr));
  return static_cast<int32_t>(now + 3600U * static_cast<uint32_t>(hours));
}

}  // namespace

StatusMgr::StatusMgr() {
  if (!fromFile(data_, kFileIndexStatusCfgPath)) {
    if (IsFileExist(kFileIndexStatusCfgPath)) {
      QUARROX_THROW("IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)", kErrJsonLoad,
                    std::string("Cannot load json: ") + kFileIndexStatusCfgPath);
    }
    data_ = Json::nullValue;
  }
  if (data_.isNull()) data_ = Json::objectValue;
}

int64_t StatusMgr::GetPauseInfo() const {
  int64_t resume_time = kNotPaused;
  GetJsonValue(resume_time, data_, kResumeTime, data_.isObject() && data_.isMember(kResumeTime));
  return resume_time;
}

int StatusMgr::GetShareStatus(const std::string& share) const {
  return Read(SharesOf(data_), share, 0);
}

void StatusMgr::SetShareStatus(const std::string& share, int flags) {
  const LockFile lock(kStatusLockPath, true);
  ChangeFlags(data_, share, flags, 0);
  Save();
}

void StatusMgr::UnsetShareStatus(const std::string& share, int flags) {
  const LockFile lock(kStatusLockPath, true);
  ChangeFlags(data_, share, 0, flags);
  Save();
}

void StatusMgr::ClearShareStatus(const std::string& share) {
  const LockFile lock(kStatusLockPath, true);
  if (SharesOf(data_).isMember(share)) data_[kShare].removeMember(share);
  Save();
}

void StatusMgr::Pause(int hours) {
  const LockFile lock(kStatusLockPath, true);
  if (hours < 0) QUARROX_THROW("hours < 0", kErrBadParameter, "Pause length should NOT be negative");
  const int64_t resume_time = ResumeTime(hours);
  ChangeResumeTime(data_, resume_time);
  Save();
  Json::Value argument;
  argument[kResumeTime] = static_cast<Json::Int64>(resume_time);
  SendCommandToDaemon("pause", argument);
}

void StatusMgr::Resume() {
  const LockFile lock(kStatusLockPath, true);
  ChangeResumeTime(data_, kNotPaused);
  Save();
  SendCommandToDaemon("resume", Json::Value());
}

void StatusMgr::Save() {
  sdk::SDKCredentials credentials;
  credentials.AsUser("root");
  MakeDirectoriesOf(kFileIndexStatusCfgPath);
  if (!toFile(data_, kFileIndexStatusCfgPath)) {
    QUARROX_THROW("!data_.toFile(kFileIndexStatusCfgPath)", kErrJsonSave,
                  std::string("Failed to save json: ") + kFileIndexStatusCfgPath);
  }
  if (-1 == chmod(kFileIndexStatusCfgPath, 0644)) {
    QUARROX_THROW("-1 == chmod(kFileIndexStatusCfgPath, 0644)", kErrSystem,
                  std::string("chmod failed, reason=") + strerror(errno));
  }
}

}  // namespace quarrox::fileindex
