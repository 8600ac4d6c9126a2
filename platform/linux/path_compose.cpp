#include "vexo/path_compose.h"

#include <climits>
#include <cstring>
#include <string>
#include <string_view>

#include "linux/failure.h"

namespace {

int Store(const std::string& text, char* buffer, size_t size) {
  if (text.size() >= size) return VEXO_FAILURE(VEXO_ERR_BUFFER_TOO_SMALL);
  memcpy(buffer, text.c_str(), text.size() + 1);
  return 0;
}

// Both places of a share are together in one hidden directory of its volume, beside the share's own directory.
int Compose(const char* share_path, const char* what, char* path, size_t size) {
  std::string_view directory = share_path;
  while (directory.ends_with('/')) directory.remove_suffix(1);
  if (!directory.starts_with('/')) return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  const size_t slash = directory.rfind('/');
  const std::string volume(directory.substr(0, slash));
  return Store(volume + "/@fileindex" + std::string(directory.substr(slash)) + what, path, size);
}

}  // namespace

int FILEIDXGetIndexID(const char* share_name, char* id, size_t size) {
  const std::string name = share_name;
  if (name.empty() || name.size() > NAME_MAX || name.find('/') != std::string::npos)
    return VEXO_FAILURE(VEXO_ERR_BAD_PARAMETER);
  return Store("fileindex_" + name, id, size);
}

int FILEIDXDBPathCompose(const char* share_path, char* path, size_t size) {
  return Compose(share_path, "/db", path, size);
}

int FILEIDXQueuePathCompose(const char* share_path, char* path, size_t size) {
  return Compose(share_path, "/queue", path, size);
}
