#include "queue_generator.h"

#include <algorithm>
#include <cstdlib>
#include <memory>
#include <unordered_set>

#include <json/json.h>

namespace quarrox::bench {

void QueueWriter::Event(uint32_t event, const std::string& path, bool is_dir, const std::string& path_old) {
  ++lines_;
  const std::string kind = "\"event\":" + std::to_string(event);
  const std::string dir = std::string("\"is_dir\":") + (is_dir ? "true" : "false");
  const std::string place = "\"path\":\"" + path + "\"";
  const std::string old = path_old.empty() ? "" : ",\"path_old\":\"" + path_old + "\"";
  if (other_order_) {
    stream_ << '{' << place << old << ',' << dir << ',' << kind << "}\n";
  } else {
    stream_ << '{' << kind << ',' << dir << ',' << place << old << "}\n";
  }
}

namespace {

class Day {
 public:
  Day(const std::string& path, size_t lines, Queue kind)
      : out_(path, kind == Queue::kOtherKeyOrder), lines_(lines), locality_(kind != Queue::kNoLocality) {
    const size_t directories = lines / 80 + 4;
    const char* const roots[] = {"Projects", "Photos", "Office documents", "Archive"};
    for (size_t i = 0; i < directories; ++i) {
      const std::string parent = i < 4 ? std::string("/volume1/share/") + roots[i] : Pick(directories_);
      directories_.push_back(parent + "/" + Word() + "-" + std::to_string(i));
    }
  }

  size_t Run() {
    const size_t wanted = lines_ / 5;
    while (out_.lines() < lines_) {
      if (random_() % 40 == 0) place_ = random_() % directories_.size();
      const size_t dice = random_() % 1000;
      if (files_.empty() || (dice < 330 && distinct_.size() < wanted)) {
        Create();
      } else if (dice < 800) {
        Say(random_() % 4 == 0 ? 0x04 : 0x08, File());
      } else if (dice < 850) {
        Delete();
      } else if (dice < 900) {
        SaveByTemporaryName();
      } else if (dice < 925) {
        RenameFile();
      } else if (dice < 926) {
        RenameDirectory();
      } else {
        Say(0x08, File());
      }
    }
    return distinct_.size();
  }

 private:
  std::string Word() {
    static const char* const words[] = {"report", "IMG",     "budget",   "invoice", "draft",  "summer",
                                        "scan",   "minutes", "contract", "holiday", "source", "backup",
                                        "notes",  "slides",  "team",     "client"};
    return words[random_() % 16];
  }
  const std::string& Pick(const std::vector<std::string>& from) { return from[random_() % from.size()]; }
  // Mostly one of those that were made lately: work on a file comes in bursts. Without locality any file is as likely.
  std::string& File() {
    const size_t window = locality_ && random_() % 10 != 0 ? std::min<size_t>(files_.size(), 500) : files_.size();
    return files_[files_.size() - 1 - random_() % window];
  }
  const std::string& Place() { return locality_ ? directories_[place_] : Pick(directories_); }
  void Say(uint32_t event, const std::string& path) {
    distinct_.insert(path);
    out_.Event(event, path);
  }
  void Create() {
    const std::string path = Place() + "/" + Word() + "_" + std::to_string(random_() % 1000000) + ".docx";
    Say(0x40, path);
    Say(0x08, path);
    files_.push_back(path);
  }
  void Rename(const std::string& from, const std::string& to, bool is_dir) {
    distinct_.insert(to);
    distinct_.insert(from);
    out_.Event(0x100, to, is_dir, from);
  }
  void SaveByTemporaryName() {
    const std::string path = File();
    const std::string temporary = path + ".tmp";
    Say(0x40, temporary);
    Say(0x08, temporary);
    Rename(temporary, path, false);
  }
  void RenameFile() {
    std::string& path = File();
    const std::string to =
        path.substr(0, path.rfind('/')) + "/" + Word() + std::to_string(random_() % 1000000) + ".docx";
    Rename(path, to, false);
    path = to;
  }
  void RenameDirectory() {
    const std::string& path = Pick(directories_);
    Rename(path, path + " (old)", true);
    Rename(path + " (old)", path, true);
  }
  void Delete() {
    std::swap(File(), files_.back());
    Say(0x80, files_.back());
    files_.pop_back();
  }

  std::mt19937 random_{20240229};
  QueueWriter out_;
  size_t lines_;
  bool locality_;
  size_t place_ = 0;
  std::vector<std::string> directories_;
  std::vector<std::string> files_;
  std::unordered_set<std::string> distinct_;
};

}  // namespace

size_t WriteRealisticQueue(const std::string& path, size_t lines, Queue kind) {
  return Day(path, lines, kind).Run();
}

void ParseLines(const std::string& queue) {
  std::ifstream stream(queue);
  const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
  std::string line;
  while (std::getline(stream, line)) {
    Json::Value value;
    if (!reader->parse(line.data(), line.data() + line.size(), &value, nullptr)) abort();
  }
}

}  // namespace quarrox::bench
