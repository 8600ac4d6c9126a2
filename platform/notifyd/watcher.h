// The two ways of hearing what happens in a tree.
//
// fanotify marks the file system of the scope's directory once, whatever its size; what is mounted below is another
// file system and is not heard. inotify, where fanotify is not permitted, needs one watch a directory. Not thread-safe.
#pragma once

#include <memory>
#include <string>

#include "event.h"
#include "scope.h"

namespace quarrox::notifyd {

class Watcher {
 public:
  virtual ~Watcher() = default;

  // "fanotify" or "inotify".
  virtual const char* method() const = 0;

  // Readable when the kernel has something to report. May change from one call of Drain() to the next.
  virtual int fd() const = 0;

  // Reads everything that the kernel has reported and gives what came of it to the sink. Also to be called when
  // Timeout() has passed without a report. Throws Error 502 when watching cannot go on.
  virtual void Drain() = 0;

  // Milliseconds after which Drain() wants to be called although nothing was reported, -1 for never.
  virtual int Timeout() const = 0;

  // To be called when something may have been unmounted and mounted again where the scope's directory is. What is
  // there now is heard afterwards. Throws Error 502.
  virtual void Renew() {}
};

// Scope and sink stay the caller's and must outlive the watcher. Everything that happens after the return is heard. The
// scope may follow other routes between two calls, where its folders stay those that a watcher of inotify was made for.

// `limited` leaves the length of the kernel's queue limited. Null, with `why` filled, where fanotify is not permitted
// or not supported here; throws Error 502 on any other failure.
std::unique_ptr<Watcher> MakeFanotifyWatcher(const Scope& scope, EventSink& sink, bool limited, std::string& why);

// Throws Error 502; the reason names the limit to raise where one was met.
std::unique_ptr<Watcher> MakeInotifyWatcher(const Scope& scope, EventSink& sink);

}  // namespace quarrox::notifyd
