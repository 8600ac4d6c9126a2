#include "linux/share_list.h"

#include <sys/stat.h>
#include <syslog.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <set>
#include <utility>

#include "common/strings.h"
#include "linux/ini_file.h"
#include "linux/share_source.h"
#include "vexo/error.h"

namespace platform {
namespace {

constexpr size_t kLongestName = 255;

enum Key { kPath, kReadOnly, kAvailable, kPrintable, kHideUnreadable, kVfsObjects, kRepository, kEncrypted, kKeyCount };

constexpr Key kSwitches[] = {kReadOnly, kAvailable, kPrintable, kHideUnreadable};

// Names of keys without blanks, which count nowhere in a name.
struct KeyName {
  const char* name;
  Key key;
  bool inverse;  // yes means no
};

constexpr KeyName kKeyNames[] = {
    {"path", kPath, false},
    {"directory", kPath, false},
    {"readonly", kReadOnly, false},
    {"writeable", kReadOnly, true},
    {"writable", kReadOnly, true},
    {"writeok", kReadOnly, true},
    {"available", kAvailable, false},
    {"printable", kPrintable, false},
    {"printok", kPrintable, false},
    {"hideunreadable", kHideUnreadable, false},
    {"vfsobjects", kVfsObjects, false},
    {"vfsobject", kVfsObjects, false},
    {"recycle:repository", kRepository, false},
    {"fileindex:encrypted", kEncrypted, false},
};

struct Setting {
  std::string key;  // as written; empty where it is not set
  std::string value;
  int line = 0;
  bool inverse = false;
};

struct Section {
  std::string name;
  int line = 0;
  std::array<Setting, kKeyCount> settings;
};

const KeyName* FindKey(const std::string& key) {
  std::string bare = key;
  std::erase(bare, ' ');
  for (const KeyName& known : kKeyNames) {
    if (bare == known.name) return &known;
  }
  return nullptr;
}

// The sections in their order; the first one gathers what is global.
std::vector<Section> ReadSections(const IniText& ini) {
  std::vector<Section> sections(1);
  sections[0].name = "global";
  bool global = true;
  for (const IniEntry& entry : ini.entries) {
    if (entry.key.empty()) {
      global = quarrox::ToLower(entry.section) == "global";
      if (!global) sections.push_back({entry.section, entry.line, {}});
    } else if (const KeyName* known = FindKey(entry.key)) {
      Section& section = global ? sections.front() : sections.back();
      section.settings[known->key] = {entry.key, entry.value, entry.line, known->inverse};
    }
  }
  return sections;
}

// Parameters of smb.conf that people expect to work, and which would change what the shares are.
void TellForeignKeys(const std::string& file, IniText* ini) {
  for (const IniEntry& entry : ini->entries) {
    if (entry.key != "include" && entry.key != "copy" && entry.key != "config file") continue;
    ini->problems.push_back(file + ":" + std::to_string(entry.line) + ": \"" + entry.key +
                            "\" does nothing in this file; write all of each share here");
  }
}

// A text for one line of a log: control bytes as \xNN, and no longer than a path may be.
std::string Printable(const std::string& text) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  std::string result;
  for (const char byte : text.substr(0, PATH_MAX)) {
    const auto code = static_cast<unsigned char>(byte);
    if (code >= 0x20 && code != 0x7F) {
      result.push_back(byte);
    } else {
      result += {'\\', 'x', kDigits[code >> 4], kDigits[code & 15]};
    }
  }
  return result;
}

// Texts may stand in double quotes; quotes inside are the text's own.
std::string Unquoted(const std::string& value) {
  if (value.size() < 2 || value.front() != '"' || value.back() != '"') return value;
  const std::string inner = value.substr(1, value.size() - 2);
  return inner.find('"') == std::string::npos ? inner : value;
}

bool HasWord(const std::string& list, const std::string& word) {
  constexpr char kSeparators[] = " \t,";
  for (size_t start = 0; (start = list.find_first_not_of(kSeparators, start)) != std::string::npos;) {
    const size_t end = std::min(list.find_first_of(kSeparators, start), list.size());
    if (Unquoted(list.substr(start, end - start)) == word) return true;
    start = end;
  }
  return false;
}

// The components of a path in one form, each behind a slash; empty, with `*dots` set, where one is "." or "..". Ends
// before the first component that has a variable if `until_variable` is set.
std::string Components(const std::string& path, bool until_variable, bool* dots) {
  std::string result;
  *dots = false;
  for (size_t start = 0; start < path.size();) {
    const size_t end = std::min(path.find('/', start), path.size());
    const std::string part = path.substr(start, end - start);
    start = end + 1;
    if (part.empty()) continue;
    if (until_variable && part.find('%') != std::string::npos) break;
    *dots = part == "." || part == "..";
    if (*dots) return "";
    result += "/" + part;
  }
  return result;
}

// Puts a share's name in the place of %S, and the directory above in the place of a user's. False, with the reason,
// where another variable is left.
bool Expand(const std::string& name, std::string path, std::string* expanded, std::string* reason) {
  const bool homes = quarrox::ToLower(name) == "homes";
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  const std::string last = quarrox::Basename(path);
  if (last == "%U" || last == "%u" || (homes && last == "%S")) path.resize(path.size() - last.size());
  expanded->clear();
  for (size_t i = 0; i < path.size(); ++i) {
    if (path[i] != '%') {
      expanded->push_back(path[i]);
    } else if (!homes && path.compare(i, 2, "%S") == 0) {
      *expanded += name;
      ++i;
    } else {
      *reason = "its path \"" + Printable(path) + "\" has the variable \"" + Printable(path.substr(i, 2)) +
                "\", which can stand for any directory; write the directory itself";
      return false;
    }
  }
  return true;
}

// Makes the list, section by section, and tells what is wrong.
class Builder {
 public:
  Builder(std::string file, bool samba, std::vector<std::string> problems)
      : file_(std::move(file)), samba_(samba), problems_(std::move(problems)) {}

  void SetDefaults(Section global) {
    Validate(&global);
    global_ = std::move(global);
  }

  void Add(Section section);
  std::shared_ptr<const ShareList> Finish();

 private:
  struct Place {
    size_t share;
    int line;
  };

  void Tell(int line, const std::string& name, const std::string& what);
  std::string Where(int line) const { return samba_ ? "" : " in line " + std::to_string(line); }
  void Validate(Section* section);
  const Setting& Get(const Section& section, Key key) const;
  bool Switch(const Section& section, Key key, bool otherwise) const;
  bool CheckName(const Section& section);
  std::string ReadPath(const Section& section);
  std::string ReadRepository(const Section& section);
  unsigned int ReadStatus(const Section& section) const;
  void CheckDirectory(const Share& share, int line);
  void CheckNesting();

  std::string file_;
  bool samba_;
  std::vector<std::string> problems_;
  Section global_;
  std::vector<Share> shares_;
  std::vector<int> lines_;  // of each share
  std::unordered_map<std::string, size_t> by_name_;
  std::unordered_map<std::string, size_t> by_path_;
};

void Builder::Tell(int line, const std::string& name, const std::string& what) {
  const std::string place = samba_ ? file_ : file_ + ":" + std::to_string(line);
  problems_.push_back(place + ": share " + Printable(name) + ": " + what);
}

// Settles what a value that nobody understands counts as.
void Builder::Validate(Section* section) {
  bool ignored = false;
  for (const Key key : kSwitches) {
    Setting& setting = section->settings[key];
    if (setting.key.empty() || ParseSwitch(setting.value, &ignored)) continue;
    Tell(setting.line, section->name,
         "\"" + setting.key + " = " + Printable(setting.value) + "\" is left out; write yes or no");
    setting = {};
  }
  Setting& encrypted = section->settings[kEncrypted];
  const std::string word = quarrox::ToLower(encrypted.value);
  if (encrypted.key.empty() || word == "locked" || ParseSwitch(word, &ignored)) return;
  // An index holds the texts of the files, so a doubt keeps them out of it.
  Tell(encrypted.line, section->name,
       "\"" + encrypted.key + " = " + Printable(encrypted.value) + "\" counts as locked; write yes, locked or no");
  encrypted.value = "locked";
}

const Setting& Builder::Get(const Section& section, Key key) const {
  const Setting& own = section.settings[key];
  return own.key.empty() ? global_.settings[key] : own;
}

bool Builder::Switch(const Section& section, Key key, bool otherwise) const {
  const Setting& setting = Get(section, key);
  bool value = otherwise;
  if (!ParseSwitch(setting.value, &value)) return otherwise;
  return value != setting.inverse;
}

bool Builder::CheckName(const Section& section) {
  const std::string& name = section.name;
  if (name.empty() || name.size() > kLongestName) {
    Tell(section.line, name.substr(0, kLongestName),
         "its name has " + std::to_string(name.size()) + " bytes, it is left out; choose one of 1 to 255 bytes");
  } else if (name.find('/') != std::string::npos || name == "." || name == "..") {
    Tell(section.line, name, "no directory can have this name, it is left out; choose one without \"/\"");
  } else if (const auto found = by_name_.find(name); found != by_name_.end()) {
    Tell(section.line, name,
         "another share" + Where(lines_[found->second]) + " has this name, this one is left out; rename it");
  } else {
    return true;
  }
  return false;
}

// The share's directory; empty, and told, where there is none that can be used.
std::string Builder::ReadPath(const Section& section) {
  const Setting& setting = Get(section, kPath);
  const std::string written = Unquoted(setting.value);
  const int line = setting.key.empty() ? section.line : setting.line;
  std::string path;
  std::string reason;
  bool dots = false;
  if (written.empty()) {
    reason = "it has no path; write \"path = DIRECTORY\"";
  } else if (Expand(section.name, written, &path, &reason)) {
    const std::string expanded = std::exchange(path, Components(path, false, &dots));
    if (expanded[0] != '/' || dots || path.size() >= PATH_MAX) {
      reason = "\"" + Printable(written) + "\" is no plain absolute path; write one without \".\" and \"..\"";
    } else if (path.empty()) {
      reason = "\"" + Printable(written) + "\" makes all of the machine a share; choose a directory below \"/\"";
    } else if (const auto found = by_path_.find(path); found != by_path_.end()) {
      reason = "its directory " + Printable(path) + " is that of the share " + Printable(shares_[found->second].name) +
               Where(lines_[found->second]) + "; remove one of the two";
    }
  }
  if (reason.empty()) return path;
  Tell(line, section.name, reason + " (the share is left out)");
  return "";
}

// Where the recycle bin is, below the share: up to the first component that is another one for each user.
std::string Builder::ReadRepository(const Section& section) {
  const Setting& setting = Get(section, kRepository);
  bool dots = false;
  const std::string written = setting.key.empty() ? ".recycle" : Unquoted(setting.value);
  const std::string repository = Components(written, true, &dots);
  if (!repository.empty()) return repository.substr(1);
  Tell(setting.line, section.name,
       "the place of its recycle bin, \"" + Printable(written) +
           "\", is not known; begin it with the name of a directory in the share");
  return "";
}

unsigned int Builder::ReadStatus(const Section& section) const {
  unsigned int status = 0;
  bool encrypted = false;
  const std::string word = quarrox::ToLower(Get(section, kEncrypted).value);
  if (word == "locked") status |= kShareEncryption | kShareLocked;
  if (ParseSwitch(word, &encrypted) && encrypted) status |= kShareEncryption;
  if (HasWord(Get(section, kVfsObjects).value, "recycle")) status |= kShareRecycle;
  if (Switch(section, kReadOnly, samba_)) status |= kShareReadOnly;
  if (Switch(section, kHideUnreadable, false)) status |= kShareHideUnreadable;
  return status;
}

void Builder::Add(Section section) {
  const std::string lower = quarrox::ToLower(section.name);
  if (lower == "printers" || lower == "print$") return;
  if (lower == "homes" && Get(section, kPath).value.empty()) return;
  Validate(&section);
  if (Switch(section, kPrintable, false) || !Switch(section, kAvailable, true)) return;
  if (!CheckName(section)) return;
  Share share{section.name, ReadPath(section), "", ReadStatus(section)};
  if (share.path.empty()) return;
  if ((share.status & kShareRecycle) != 0) share.recycle = ReadRepository(section);
  const Setting& path = Get(section, kPath);
  CheckDirectory(share, path.line);
  by_name_.emplace(share.name, shares_.size());
  by_path_.emplace(share.path, shares_.size());
  lines_.push_back(section.line);
  shares_.push_back(std::move(share));
}

// A disk may be unmounted and a directory renamed: such a share stays, and what to do is told.
void Builder::CheckDirectory(const Share& share, int line) {
  const std::string path = Printable(share.path);
  const std::string directory_name = quarrox::Basename(share.path);
  if (directory_name != share.name) {
    Tell(line, share.name,
         "its directory is called " + Printable(directory_name) +
             ", so its files cannot be indexed; give the share and its directory one name");
  }
  struct stat info;
  if (stat(share.path.c_str(), &info) != 0) {
    if (errno == ENOENT || errno == ENOTDIR) {
      Tell(line, share.name, "its directory " + path + " does not exist; create it or mount its disk");
    } else if (errno != EACCES) {
      Tell(line, share.name, "its directory " + path + " cannot be looked at; " + strerror(errno));
    }
    return;
  }
  if (!S_ISDIR(info.st_mode)) return Tell(line, share.name, path + " is no directory; choose one");
  const std::unique_ptr<char, decltype(&free)> real(realpath(share.path.c_str(), nullptr), free);
  if (real == nullptr || share.path == real.get()) return;
  Tell(line, share.name,
       path + " goes through a symbolic link, so its files cannot be indexed; write \"path = " + Printable(real.get()) +
           "\"");
}

void Builder::CheckNesting() {
  for (size_t i = 0; i < shares_.size(); ++i) {
    std::string above = shares_[i].path;
    while (!(above = quarrox::Dirname(above)).empty()) {
      const auto outer = by_path_.find(above);
      if (outer == by_path_.end()) continue;
      const std::string& outer_name = shares_[outer->second].name;
      Tell(lines_[i], shares_[i].name,
           "it lies in the share " + Printable(outer_name) + Where(lines_[outer->second]) + ", but what is below " +
               Printable(shares_[i].path) + " belongs to it alone; move it out of there if that is not meant");
      break;
    }
  }
}

std::shared_ptr<const ShareList> Builder::Finish() {
  CheckNesting();
  return std::make_shared<const ShareList>(std::move(shares_), std::move(problems_));
}

// The one list of this process.
struct Cache {
  std::mutex mutex;
  ShareSource source;                     // without its text
  std::shared_ptr<const ShareList> list;  // null where the source could not be read
  std::set<std::string> told;             // what the system log has of the list's problems
};

// What was told of the list before is not told again.
void TellOnce(Cache* cache, const std::vector<std::string>& problems) {
  for (const std::string& problem : problems) {
    if (!cache->told.contains(problem)) syslog(LOG_WARNING, "shares: %s", problem.c_str());
  }
  cache->told = {problems.begin(), problems.end()};
}

void Refresh(Cache* cache) {
  ShareSource source = ReadShareSource();
  if (source.error != 0) {
    cache->list = nullptr;
    TellOnce(cache, {source.failure});
  } else if (source.settled) {
    cache->list = ParseShares(source.text, source.file, source.samba);
  } else {
    const std::string problem = source.file + ": it changes all the time, so it was not read as a whole; let it rest";
    auto list = cache->list;
    if (list == nullptr) list = ParseShares(source.text, source.file, source.samba);
    std::vector<std::string> problems = list->problems();
    if (problems.empty() || problems.back() != problem) problems.push_back(problem);
    cache->list = std::make_shared<const ShareList>(list->shares(), std::move(problems));
  }
  if (cache->list != nullptr) TellOnce(cache, cache->list->problems());
  source.text = {};
  cache->source = std::move(source);
}

}  // namespace

ShareList::ShareList(std::vector<Share> shares, std::vector<std::string> problems)
    : shares_(std::move(shares)), problems_(std::move(problems)) {
  for (const Share& share : shares_) {
    by_name_.emplace(share.name, &share);
    by_path_.emplace(share.path, &share);
    const std::string_view path = share.path;
    volumes_.insert(path.substr(0, std::max<size_t>(path.rfind('/'), 1)));
    longest_path_ = std::max(longest_path_, path.size());
  }
}

const Share* ShareList::FindByName(std::string_view name) const {
  const auto found = by_name_.find(name);
  return found == by_name_.end() ? nullptr : found->second;
}

const Share* ShareList::FindByPath(std::string_view path) const {
  // What is longer than any share's path need not be looked up.
  size_t end = path.size() > longest_path_ ? path.rfind('/', longest_path_) : path.size();
  for (; end != 0 && end != std::string_view::npos; end = path.rfind('/', end - 1)) {
    if (const auto found = by_path_.find(path.substr(0, end)); found != by_path_.end()) return found->second;
  }
  return nullptr;
}

bool ShareList::IsShareDirectory(std::string_view path) const {
  return by_path_.contains(path);
}

bool ShareList::IsVolume(std::string_view path) const {
  return volumes_.contains(path);
}

std::shared_ptr<const ShareList> ParseShares(std::string_view text, const std::string& file, bool samba) {
  IniText ini = ParseIni(text, samba ? file + " as testparm prints it" : file);
  std::vector<Section> sections = ReadSections(ini);
  if (!samba) TellForeignKeys(file, &ini);
  Builder builder(file, samba, std::move(ini.problems));
  builder.SetDefaults(std::move(sections[0]));
  for (size_t i = 1; i < sections.size(); ++i) builder.Add(std::move(sections[i]));
  return builder.Finish();
}

std::shared_ptr<const ShareList> Shares(std::string* failure) {
  static Cache* const cache = new Cache;  // lives as long as the process, for threads that outlive main()
  const int error = errno;
  const std::lock_guard lock(cache->mutex);
  if (!IsCurrent(cache->source)) Refresh(cache);
  errno = error;
  if (cache->list == nullptr) {
    if (failure != nullptr) *failure = cache->source.failure;
    errno = cache->source.error;
    VLIBCErrSet(VEXO_ERR_BAD_CONFIG);
  }
  return cache->list;
}

}  // namespace platform
