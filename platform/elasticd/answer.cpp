#include "answer.h"

#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "error_code.h"

namespace quarrox::elasticd {
namespace {

UniqueFd OpenNameless(const std::string& directory) {
  UniqueFd file(open(directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC | O_EXCL, 0600));
  if (file || (errno != EOPNOTSUPP && errno != EISDIR)) return file;
  std::string name = directory + "/answer.XXXXXX";  // this file system has no files without a name
  file = UniqueFd(mkostemp(name.data(), O_CLOEXEC));
  if (file) unlink(name.c_str());
  return file;
}

}  // namespace

void Answer::Open() {
  file_ = OpenNameless(spool_directory_);
  if (!file_ && errno == ENOENT && mkdir(spool_directory_.c_str(), 0700) == 0) file_ = OpenNameless(spool_directory_);
  if (file_) return;
  const int error = errno;
  throw Error(kNoRoom, "A large answer needs a file in " + spool_directory_ +
                           ", which cannot be made: " + strerror(error) + "; make room there or ask for less");
}

// The file's size as it was, where this fails.
void Answer::Write(std::string_view text) {
  if (!file_) Open();
  uint64_t end = spooled_;
  while (!text.empty()) {
    const ssize_t written = pwrite(file_.get(), text.data(), text.size(), static_cast<off_t>(end));
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) {
      const int error = errno;
      throw Error(kNoRoom, "A large answer cannot be written to " + spool_directory_ + ": " + strerror(error) +
                               "; make room there or ask for less");
    }
    end += static_cast<uint64_t>(written);
    text.remove_prefix(static_cast<size_t>(written));
  }
  spooled_ = end;
}

void Answer::FlushTail() {
  Write(tail_);
  tail_.clear();
}

void Answer::Append(std::string_view text) {
  if (text.size() > longest_ - std::min(longest_, size_)) {
    throw Error(kBadArgument, "The answer is longer than " + std::to_string(longest_ >> 20) +
                                  " MiB; ask for less at a time, with \"from\" and \"size\"");
  }
  if (spooled_ == 0 && tail_.empty() && memory_.size() + text.size() <= kInMemory) {
    memory_ += text;
  } else {
    if (tail_.size() + text.size() > kPiece) FlushTail();
    text.size() > kPiece ? Write(text) : void(tail_ += text);
  }
  size_ += text.size();
}

void Answer::Clear() {
  if (memory_.capacity() > kPiece) std::string().swap(memory_);
  memory_.assign(sizeof(uint32_t), '\0');
  file_.Close();
  spooled_ = 0;
  std::string().swap(tail_);
  size_ = 0;
}

void Answer::Cut(uint64_t size) {
  const uint64_t in_memory = memory_.size() - sizeof(uint32_t);
  const uint64_t whole = in_memory + spooled_;
  size_ = size;
  tail_.resize(size > whole ? static_cast<size_t>(size - whole) : 0);
  spooled_ = std::min(spooled_, size > in_memory ? size - in_memory : 0);
  if (size < in_memory) memory_.resize(sizeof(uint32_t) + static_cast<size_t>(size));
}

}  // namespace quarrox::elasticd
