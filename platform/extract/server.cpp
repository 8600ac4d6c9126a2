#include "extract/server.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <exception>
#include <new>
#include <system_error>
#include <thread>

#include "common/json.h"
#include "common/unique_fd.h"
#include "extract/extended_attributes.h"
#include "extract/plain_text.h"
#include "extract/sandbox.h"
#include "linux/content_extract_wire.h"

using quarrox::UniqueFd;

namespace platform::extract {
namespace {

// Processor time for a file. Whoever asked stops waiting after a time by the clock; this also ends what that one does
// not see: filters that are left. In seconds.
constexpr unsigned int kTimeForFile = 30;

// A process that holds so much memory, in bytes, has earned its rest: libraries leak.
constexpr size_t kMostResident = size_t{256} << 20;

constexpr const char* kText = "VEXOMDTextContent";

// False where nobody asks any more. The descriptor is taken.
bool ReceiveRequest(int socket, wire::Request* request, UniqueFd* file) {
  iovec part = {request, sizeof(*request)};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  ssize_t size = -1;
  do {
    size = recvmsg(socket, &message, MSG_CMSG_CLOEXEC | MSG_WAITALL);
  } while (size < 0 && errno == EINTR);
  const cmsghdr* const header = CMSG_FIRSTHDR(&message);
  if (size != static_cast<ssize_t>(sizeof(*request)) || header == nullptr) return false;
  int fd = -1;
  memcpy(&fd, CMSG_DATA(header), sizeof(fd));
  *file = UniqueFd(fd);
  request->extension[sizeof(request->extension) - 1] = '\0';
  return true;
}

bool Send(int socket, wire::Answer answer, const std::string& words, const std::string& text = {}) {
  answer.words_size = static_cast<uint32_t>(words.size());
  answer.text_size = static_cast<uint32_t>(text.size());
  iovec parts[] = {{&answer, sizeof(answer)},
                   {const_cast<char*>(words.data()), words.size()},
                   {const_cast<char*>(text.data()), text.size()}};
  msghdr message = {};
  message.msg_iov = parts;
  message.msg_iovlen = std::size(parts);
  while (message.msg_iovlen > 0) {
    const ssize_t n = sendmsg(socket, &message, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    auto left = static_cast<size_t>(n);
    while (message.msg_iovlen > 0 && left >= message.msg_iov->iov_len) {
      left -= message.msg_iov->iov_len;
      ++message.msg_iov;
      --message.msg_iovlen;
    }
    if (message.msg_iovlen == 0) break;
    message.msg_iov->iov_base = static_cast<char*>(message.msg_iov->iov_base) + left;
    message.msg_iov->iov_len -= left;
  }
  return true;
}

// Whether an error is the disk's, or of another machine that lends it, or of this one where it is short of processes,
// or of a program that is not there.
bool MayPass(const std::error_code& code) {
  constexpr int kErrors[] = {EIO,        ESTALE, ETIMEDOUT, EHOSTUNREACH, ENOTCONN,
                             ECONNRESET, ENOENT, EAGAIN,    EMFILE,       ENFILE};
  return code.category() == std::generic_category() &&
         std::find(std::begin(kErrors), std::end(kErrors), code.value()) != std::end(kErrors);
}

struct Failure {
  std::string words;  // empty: none
  int error = 0;      // where it may pass
};

template <typename Work>
Failure Extract(const Work& work) {
  try {
    work();
    return {};
  } catch (const std::bad_alloc&) {
    return {"reading the file takes too much memory"};
  } catch (const std::system_error& error) {
    return {error.what(), MayPass(error.code()) ? error.code().value() : 0};
  } catch (const std::exception& error) {
    return {std::string("the file is damaged: ") + error.what()};
  } catch (...) {
    return {"the file is damaged"};
  }
}

// What was found in a damaged file is kept; a disk that fails is another matter.
bool Answer(int socket, Extractor extract, const Source& source, bool is_last) {
  Findings findings;
  Failure failure = Extract([&] {
    ReadExtendedAttributes(source, findings);
    extract(source, findings);
  });
  Json::Value found = findings.Take();
  const bool is_damaged = failure.error == 0 && !failure.words.empty() && found.empty();
  const bool is_text = source.type.starts_with("text/") || source.type == "message/rfc822";
  if (is_damaged && is_text) {  // what is no XML, or no mail, may still be text
    failure = Extract([&] { ReadText(source, findings); });
    found = findings.Take();
  }
  const bool is_guess = source.type == "application/octet-stream";  // by its name alone, which many others bear
  const bool failed = failure.error != 0 || (!failure.words.empty() && found.empty() && !is_guess);
  wire::Answer answer;
  answer.kind = failed ? wire::kFailed : wire::kFound;
  answer.error = failure.error;
  answer.is_last = is_last || MemoryNow().resident > kMostResident ? 1 : 0;
  std::string text;
  if (found.isMember(kText)) {
    text = found[kText].asString();
    found.removeMember(kText);
  }
  const bool sent = failed ? Send(socket, answer, failure.words + " (" + source.type + ")")
                           : Send(socket, answer, quarrox::toString(found), text);
  return sent && answer.is_last == 0;
}

}  // namespace

Extractor ReaderOf(const std::string& type) {
  const Extractor extractor = FindExtractor(type);
  return extractor == nullptr ? ReadText : extractor;
}

// A thread of the parent that ends says nothing about the parent, unlike with PR_SET_PDEATHSIG.
int OpenParent() {
  return static_cast<int>(syscall(SYS_pidfd_open, getppid(), 0));
}

void EndWith(int parent) {
  std::thread([parent] {
    pollfd item = {parent, POLLIN, 0};
    while (poll(&item, 1, -1) < 0 && errno == EINTR) {
    }
    _exit(0);
  }).detach();
}

void Serve(int socket, const Json::Value& features, const Ways& ways, int most_files) {
  wire::Answer ready;
  ready.error = wire::kVersion;
  if (!Send(socket, ready, quarrox::toString(features))) return;
  for (int count = 1;; ++count) {
    wire::Request request;
    UniqueFd file;
    if (!ReceiveRequest(socket, &request, &file)) return;
    LimitTime(kTimeForFile);
    Source source{file.get(), request.size, {}, request.extension};
    const Failure failure = Extract([&] { source.type = ways.type_of(source); });
    if (!failure.words.empty()) {
      wire::Answer failed;
      failed.kind = wire::kFailed;
      failed.error = failure.error;
      if (!Send(socket, failed, failure.words)) return;
      continue;
    }
    const Extractor extract = ways.extractor_of(source.type);
    wire::Answer type;
    type.kind = wire::kType;
    if (extract != ReadText && !Send(socket, type, source.type)) return;
    if (!Answer(socket, extract, source, count == most_files)) return;
  }
}

}  // namespace platform::extract
