// How the machine in memory finds things. What is not there is thrown, as the number of the last error.
#pragma once

#include <algorithm>
#include <filesystem>
#include <map>
#include <string>
#include <system_error>
#include <type_traits>
#include <vector>

#include "support/fake_platform/fake_platform.h"

namespace quarrox::support {

namespace fs = std::filesystem;

template <typename T, typename Value>
const T& Find(const std::vector<T>& all, Value T::*member, const std::type_identity_t<Value>& value, int error) {
  const auto found = std::ranges::find(all, value, member);
  return found == all.end() ? throw int{error} : *found;
}

inline const FakeShare& Share(const std::string& name) {
  return Find(FakePlatform::Get().shares, &FakeShare::name, name, VEXO_ERR_NO_SUCH_SHARE);
}

inline const FakeUser& User(const std::string& name) {
  return Find(FakePlatform::Get().users, &FakeUser::name, name, VEXO_ERR_NO_SUCH_USER);
}

// Whether a path is a directory or below it, by whole components.
inline bool Holds(const fs::path& dir, const fs::path& path) {
  return std::mismatch(dir.begin(), dir.end(), path.begin(), path.end()).first == dir.end();
}

inline bool Exists(const std::string& dir) {
  std::error_code ignored;
  return FakePlatform::Get().mounts.contains(dir) || fs::is_directory(dir, ignored);
}

// What the innermost directory that holds a path says. A directory sorts before what is below it.
inline int Innermost(const std::map<std::string, int>& dirs, const std::string& path) {
  int result = 0;
  for (const auto& [dir, value] : dirs) result = Holds(dir, path) ? value : result;
  return result;
}

inline const FakeShare& ShareOf(const std::string& path) {
  const FakeShare* innermost = nullptr;
  for (const FakeShare& share : FakePlatform::Get().shares) {
    if (Holds(share.path, path) && (!innermost || Holds(innermost->path, share.path))) innermost = &share;
  }
  return innermost ? *innermost : throw int{VEXO_ERR_NO_SUCH_SHARE};
}

inline std::string HomeOf(const FakeUser& user) {
  for (const FakeShare& share : FakePlatform::Get().shares) {
    if (share.name == "homes" && Exists(share.path + "/" + user.name)) return share.path + "/" + user.name;
  }
  return user.home;
}

inline std::string IndexId(const std::string& share_name) {
  const bool is_name = !share_name.empty() && share_name.size() <= 255 && share_name.find('/') == share_name.npos;
  return is_name ? "fileindex_" + share_name : throw int{VEXO_ERR_BAD_PARAMETER};
}

inline std::string Compose(const fs::path& share_path, const char* file) {
  const fs::path dir = share_path.has_filename() ? share_path : share_path.parent_path();
  if (!dir.is_absolute() || !dir.has_filename()) throw int{VEXO_ERR_BAD_PARAMETER};
  return dir.parent_path() / "@fileindex" / dir.filename() / file;
}

inline bool InRecycle(const FakeShare& share, const std::string& path) {
  return share.recycle && Holds(share.path + "/#recycle", path);
}

inline bool InHomeRecycle(const fs::path& homes, const fs::path& path) {
  if (!Holds(homes, path)) return false;
  const fs::path bin = homes / *path.lexically_relative(homes).begin() / "#recycle";
  return Holds(bin, path) && Exists(bin);
}

inline bool InSnapshot(const fs::path& path) {
  if (path.is_relative()) throw int{VEXO_ERR_BAD_PARAMETER};
  return std::ranges::any_of(FakePlatform::Get().shares, [&](const FakeShare& share) {
    const fs::path dir = share.path, volume = dir.parent_path();
    return Holds(dir / "#snapshot", path) || Holds(dir / ".snapshots", path) || Holds(volume / "#snapshot", path) ||
           Holds(volume / ".snapshots", path);
  });
}

// Types of file systems are numbered by family, with gaps.
inline bool IsInFamily(int type, int first, int last, int other) {
  return (type >= first && type <= last) || type == other;
}

inline int Enough(int error) {
  return error == VEXO_ERR_NONE ? 1 : throw int{error};
}

inline bool IsMountPoint(const std::string& path) {
  const auto is_here = [&](const FakeShare& share) { return share.path == path; };
  return FakePlatform::Get().mounts.contains(path) && std::ranges::none_of(FakePlatform::Get().shares, is_here);
}

// Monitor configurations.
inline std::string QueueOf(const Json::Value& config) {
  return config.isObject() && config["queue"].isString() ? config["queue"].asString() : "";
}

inline bool IsMonitor(const Json::Value& config) {
  return QueueOf(config).starts_with('/') && config["config"].isArray() &&
         std::ranges::all_of(config["config"], [](const Json::Value& part) {
           return part.isObject() && part["path"].isString() && part["mask"].isIntegral() &&
                  (part["ignore"].isArray() || !part.isMember("ignore"));
         });
}

}  // namespace quarrox::support
