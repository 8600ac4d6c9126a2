#include "search_bench_bare.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <xapian.h>
#include <zstd.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string_view>
#include <system_error>

#include <json/json.h>

#include "analysis.h"
#include "common/strings.h"
#include "common/unique_fd.h"
#include "fileindex/elastic_control.h"
#include "mapping.h"

namespace quarrox::bench {
namespace {

constexpr char kTextField[] = "VEXOMDTextContent";
constexpr int kZstdLevel = 1;

struct File {
  struct stat info;
  std::string text;
};

File ReadFile(const std::string& path) {
  const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  File file;
  if (fd.get() < 0 || fstat(fd.get(), &file.info) != 0) throw std::system_error(errno, std::generic_category(), path);
  file.text.resize(static_cast<size_t>(file.info.st_size));
  if (read(fd.get(), file.text.data(), file.text.size()) != file.info.st_size) {
    throw std::system_error(EIO, std::generic_category(), path);
  }
  return file;
}

// The fields that a file's document has, save those that the engine makes of its place.
Json::Value MakeFields(const std::string& path, const File& file) {
  const std::string name = Basename(path);
  const size_t dot = name.rfind('.');
  Json::Value fields;
  fields[kTextField] = file.text;
  fields["VEXOMDDisplayName"] = name;
  fields["VEXOMDSearchFileName"] = name;
  fields["VEXOMDExtension"] = dot == std::string::npos ? "" : name.substr(dot + 1);
  fields["VEXOMDKind"] = "file";
  fields["VEXOMDIsDir"] = false;
  fields["VEXOMDOwnerUserID"] = std::to_string(file.info.st_uid);
  fields["VEXOMDOwnerGroupID"] = std::to_string(file.info.st_gid);
  fields["VEXOMDPrivilege"] = "644";
  for (const char* size : {"VEXOMDFSSize", "VEXOMDLogicalSize", "VEXOMDPhysicalSize"}) {
    fields[size] = Json::Int64{file.info.st_size};
  }
  for (const char* date : {"VEXOMDFSContentChangeDate", "VEXOMDContentModificationDate", "VEXOMDAttributeChangeDate",
                           "VEXOMDLastUsedDate", "VEXOMDFSCreationDate"}) {
    fields[date] = Json::Int64{file.info.st_mtime};
  }
  return fields;
}

// Makes documents with the engine's terms.
class OurTerms {
 public:
  Xapian::Document Make(const std::string& path, const File& file) {
    Xapian::Document document;
    const elasticd::AnalyzedDocument& content = analyzer_.Analyze(MakeFields(path, file), {});
    for (const auto& [text, count] : content.terms) {
      term_ = text;
      document.add_term(term_, count);
    }
    for (const auto& [field, number] : content.numbers) document.add_value(field, Xapian::sortable_serialise(number));
    return document;
  }

 private:
  elasticd::Mapping mapping_{fileindex::elastic::GetFileIndexMappings()};
  elasticd::DocumentAnalyzer analyzer_{mapping_};
  std::string term_;
};

// The same with Xapian's own.
class XapianTerms {
 public:
  Xapian::Document Make(const std::string& path, const File& file) {
    constexpr Xapian::valueno kNumbers = 9;  // as many as the schema has for a file: sizes, dates, one truth value
    Xapian::Document document;
    generator_.set_document(document);
    generator_.index_text_without_positions(file.text);
    generator_.index_text_without_positions(Basename(path));
    for (Xapian::valueno field = 0; field < kNumbers; ++field) {
      document.add_value(field, Xapian::sortable_serialise(static_cast<double>(file.info.st_size)));
    }
    return document;
  }

 private:
  Xapian::TermGenerator generator_;
};

// Compresses texts; reuses its memory.
class Compressor {
 public:
  std::string_view Compress(std::string_view text) {
    packed_.resize(std::max(packed_.size(), ZSTD_compressBound(text.size())));
    const size_t size =
        ZSTD_compressCCtx(context_.get(), packed_.data(), packed_.size(), text.data(), text.size(), kZstdLevel);
    if (ZSTD_isError(size) != 0) throw std::system_error(EIO, std::generic_category(), ZSTD_getErrorName(size));
    return std::string_view(packed_).substr(0, size);
  }

 private:
  std::unique_ptr<ZSTD_CCtx, size_t (*)(ZSTD_CCtx*)> context_{ZSTD_createCCtx(), ZSTD_freeCCtx};
  std::string packed_;
};

// The key of a document's text.
std::string TextKey(Xapian::docid id) {
  char key[16];
  snprintf(key, sizeof(key), "t%08x", id);
  return key;
}

template <typename Terms>
void Index(const std::vector<std::string>& paths, size_t commit_every, const std::string& directory) {
  Xapian::WritableDatabase database(directory, Xapian::DB_CREATE | Xapian::DB_BACKEND_GLASS);
  Terms terms;
  Compressor compressor;
  size_t count = 0;
  for (const std::string& path : paths) {
    const File file = ReadFile(path);
    Xapian::Document document = terms.Make(path, file);
    document.set_data(path);
    const Xapian::docid id = database.add_document(document);
    database.set_metadata(TextKey(id), std::string(compressor.Compress(file.text)));
    if (++count % commit_every == 0) database.commit();
  }
  database.commit();
}

void Rename(const std::vector<std::string>& paths, size_t old_size, const std::string& new_top,
            const std::string& directory) {
  Xapian::WritableDatabase database(directory, Xapian::DB_OPEN);
  OurTerms terms;
  Xapian::docid id = 0;
  for (const std::string& path : paths) {
    Xapian::Document document = terms.Make(path, ReadFile(path));
    document.set_data(new_top + path.substr(old_size));
    database.replace_document(++id, document);
    if (id % kCommitEvery == 0) database.commit();
  }
  database.commit();
}

// Xapian's exceptions are no std::exception, which everybody else catches.
template <typename Work>
auto Translated(const Work& work) {
  try {
    return work();
  } catch (const Xapian::Error& error) {
    throw std::runtime_error("Xapian: " + error.get_description());
  }
}

// A child that is measured must not end with an exception of its own accord.
Cost MeasureOnce(const std::function<void()>& work) {
  return Measure(
      [&] {
        try {
          Translated(work);
        } catch (const std::exception& error) {
          fprintf(stderr, "%s\n", error.what());
          _exit(1);
        }
      },
      1);
}

bool IsPlain(std::string_view word) {
  return std::all_of(word.begin(), word.end(), [](char c) { return c >= 'a' && c <= 'z'; });
}

}  // namespace

Cost IndexBare(const std::vector<std::string>& paths, BareTerms terms, size_t commit_every,
               const std::string& directory) {
  const auto index = terms == BareTerms::kOurs ? Index<OurTerms> : Index<XapianTerms>;
  return MeasureOnce([&] { index(paths, commit_every, directory); });
}

Cost RenameBare(const std::vector<std::string>& paths, const std::string& old_top, const std::string& new_top,
                const std::string& directory) {
  return MeasureOnce([&] { Rename(paths, old_top.size(), new_top, directory); });
}

struct BareSearch::Impl {
  explicit Impl(const std::string& directory) : database(directory) {}

  const Xapian::Database database;
  const std::string prefix =
      elasticd::PrefixOf(elasticd::Mapping(fileindex::elastic::GetFileIndexMappings()).Get(kTextField));
};

BareSearch::BareSearch(const std::string& directory)
    : impl_(Translated([&] { return std::make_unique<Impl>(directory); })) {}

BareSearch::~BareSearch() = default;

size_t BareSearch::FirstPage(const std::vector<std::string>& terms) const {
  return Translated([&] {
    Xapian::Enquire enquire(impl_->database);
    enquire.set_query(Xapian::Query(Xapian::Query::OP_AND, terms.begin(), terms.end()));
    const Xapian::MSet hits = enquire.get_mset(0, kPage);
    size_t read = 0;
    for (auto hit = hits.begin(); hit != hits.end(); ++hit) read += hit.get_document().get_data().empty() ? 0 : 1;
    return read;
  });
}

std::vector<BareSearch::Word> BareSearch::Words(unsigned int document) const {
  return Translated([&] {
    const Xapian::Database& database = impl_->database;
    const std::string& prefix = impl_->prefix;
    std::vector<Word> words;
    auto term = database.termlist_begin(document);
    for (term.skip_to(prefix); term != database.termlist_end(document) && (*term).starts_with(prefix); ++term) {
      const std::string word = (*term).substr(prefix.size());
      if (IsPlain(word)) {
        words.push_back({word, *term, static_cast<double>(term.get_termfreq()) / database.get_doccount()});
      }
    }
    return words;
  });
}

}  // namespace quarrox::bench
