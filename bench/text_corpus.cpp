#include "text_corpus.h"

#include <zlib.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>

#include "linux/utf8.h"

namespace quarrox::bench {
namespace {

namespace fs = std::filesystem;

constexpr const char* kRoots[] = {"/usr/include", "/usr/share/doc", "/usr/lib/python3", "/usr/share/perl"};
constexpr size_t kLongest = size_t{4} << 20;
constexpr std::string_view kPacked = ".gz";

std::vector<std::string> ListFiles(const std::string& root) {
  std::vector<std::string> files;
  std::error_code error;
  fs::recursive_directory_iterator entry(root, fs::directory_options::skip_permission_denied, error);
  for (; !error && entry != fs::recursive_directory_iterator(); entry.increment(error)) {
    if (entry->symlink_status(error).type() == fs::file_type::regular) files.push_back(entry->path().string());
  }
  std::sort(files.begin(), files.end());
  return files;
}

// All candidates, a file of each root in turn: a small corpus is as mixed as a large one.
std::vector<std::string> ListInTurn() {
  std::vector<std::vector<std::string>> lists;
  size_t longest = 0;
  for (const char* root : kRoots) {
    lists.push_back(ListFiles(root));
    longest = std::max(longest, lists.back().size());
  }
  std::vector<std::string> files;
  for (size_t i = 0; i < longest; ++i) {
    for (const std::vector<std::string>& list : lists) {
      if (i < list.size()) files.push_back(list[i]);
    }
  }
  return files;
}

// What is in a file, unpacked; none where it is no text of the wanted size.
std::optional<std::string> ReadText(const std::string& path) {
  const std::unique_ptr<gzFile_s, int (*)(gzFile)> file(gzopen(path.c_str(), "rbe"),
                                                        gzclose);  // reads unpacked ones too
  if (file == nullptr) return std::nullopt;
  std::string text(kLongest + 1, '\0');
  const int size = gzread(file.get(), text.data(), static_cast<unsigned int>(text.size()));
  if (size <= 0 || static_cast<size_t>(size) > kLongest) return std::nullopt;
  text.resize(static_cast<size_t>(size));
  if (text.find('\0') != std::string::npos || !platform::IsUtf8(text)) return std::nullopt;
  return text;
}

class Maker {
 public:
  Maker(const std::string& directory, size_t files) : directory_(directory), wanted_(files) {}

  TextCorpus Make() {
    const std::vector<std::string> candidates = ListInTurn();
    size_t before = 0;
    for (int round = 0; corpus_.paths.size() < wanted_; ++round) {
      TakeAll(candidates, round);
      if (corpus_.paths.size() == before) abort();  // a machine without any text
      before = corpus_.paths.size();
    }
    return std::move(corpus_);
  }

 private:
  void TakeAll(const std::vector<std::string>& candidates, int round) {
    const std::string top = directory_ + (round == 0 ? "" : "/copy" + std::to_string(round));
    const std::string line = round == 0 ? "" : "\ncopy " + std::to_string(round) + "\n";
    for (const std::string& path : candidates) {
      if (corpus_.paths.size() == wanted_) return;
      const bool is_packed = path.ends_with(kPacked);
      const std::string target = top + (is_packed ? path.substr(0, path.size() - kPacked.size()) : path);
      if (is_packed && fs::exists(target)) continue;  // it lies there unpacked as well
      if (const std::optional<std::string> text = ReadText(path)) Write(target, *text + line);
    }
  }

  void Write(const std::string& path, const std::string& text) {
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream out(path, std::ios::binary);
    if (!out.write(text.data(), static_cast<std::streamsize>(text.size())).flush()) {
      throw std::system_error(errno, std::generic_category(), path);
    }
    corpus_.paths.push_back(path);
    corpus_.bytes += text.size();
  }

  const std::string directory_;
  const size_t wanted_;
  TextCorpus corpus_;
};

}  // namespace

TextCorpus MakeTextCorpus(const std::string& directory, size_t files) {
  return Maker(directory, files).Make();
}

}  // namespace quarrox::bench
