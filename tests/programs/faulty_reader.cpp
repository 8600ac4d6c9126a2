// faulty_reader --worker: reads files as vexocontentextract does, in the same sandbox, and fails as the file's
// extension says; any other is read as plain text.
#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <iterator>
#include <new>
#include <stdexcept>
#include <system_error>
#include <vector>

#include "extract/file_type.h"
#include "extract/plain_text.h"
#include "extract/sandbox.h"
#include "extract/server.h"

namespace {

using namespace platform::extract;

void Spin() {
  while (getppid() >= 0) {
  }
}

void* Map() {
  return mmap(nullptr, size_t{64} << 20, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
}

void Grow() {
  std::vector<void*> all;
  for (void* more = nullptr; (more = Map()) != MAP_FAILED;) all.push_back(more);
  for (void* const part : all) munmap(part, size_t{64} << 20);
  throw std::bad_alloc();
}

struct Fault {
  const char* type;
  Extractor extract;
};

constexpr Fault kFaults[] = {
    {"x-crash", [](const Source&, Findings&) { raise(SIGSEGV); }},
    {"x-kill", [](const Source&, Findings&) { raise(SIGKILL); }},
    {"x-exit", [](const Source&, Findings&) { _exit(3); }},
    {"x-hang", [](const Source&, Findings&) { pause(); }},
    {"x-spin", [](const Source&, Findings&) { Spin(); }},
    {"x-grow", [](const Source&, Findings&) { Grow(); }},
    {"x-late",
     [](const Source&, Findings& findings) { findings.Set("VEXOMDTitle", "found"), throw std::runtime_error("late"); }},
    {"x-disk",
     [](const Source&, Findings& findings) {
       findings.Set("VEXOMDTitle", "half");
       throw std::system_error(EIO, std::generic_category());
     }},
    {"x-lies",
     [](const Source&, Findings& findings) {
       findings.Set("VEXOMDPath", "/etc/shadow");
       findings.Set("VEXOMDTitle", "lies");
     }},
    {"x-short", [](const Source& source,
                   Findings& findings) { findings.Set("VEXOMDTitle", Mapping(source).bytes().substr(8192, 9)); }},
    {"x-nonsense", [](const Source&, Findings&) {
       const std::vector<char> noise(64, '\xff');
       if (write(STDIN_FILENO, noise.data(), noise.size()) < 0) abort();
     }}};

const Fault* FindFault(const std::string& type) {
  const auto* const fault =
      std::find_if(std::begin(kFaults), std::end(kFaults), [&](const Fault& other) { return type == other.type; });
  return fault == std::end(kFaults) ? nullptr : fault;
}

std::string TypeOf(const Source& source) {
  const Fault* const fault = FindFault("x-" + source.extension);
  return fault == nullptr ? "text/plain" : fault->type;
}

Extractor ExtractorOf(const std::string& type) {
  const Fault* const fault = FindFault(type);
  return fault == nullptr ? ReadText : fault->extract;
}

}  // namespace

int main() {
  signal(SIGSEGV, SIG_DFL);  // not a sanitizer's
  signal(SIGBUS, SIG_DFL);
  const int parent = OpenParent();
  const Json::Value features = EnterSandbox();
  EndWith(parent);
  Serve(STDIN_FILENO, features, {TypeOf, ExtractorOf}, 100);
  _exit(0);
}
