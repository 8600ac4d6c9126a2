// The path rules in people's words.
#include <string>

#include "fileindex/util.h"

namespace quarrox::fileindex {
namespace {

// A "%" in a text stands for the verdict's detail; a text with one is used only where there is a detail.
struct RuleText {
  const char* name;
  const char* reason;
  const char* remedy;
};

constexpr RuleText kRuleTexts[] = {
    {"", "", ""},
    {"snapshot", "it lies in a snapshot, whose files are older states of others",
     "index the directory that the snapshot was taken of"},
    {"not_found", "it cannot be looked at; most likely it does not exist", "check the path and the rights on it"},
    {"file_system", "it lies on %",
     "index files of another machine there, and an image by a copy of its files in a share"},
    {"share_locked", "the share % is encrypted and locked", "unlock the share"},
    {"share_read_only", "the share % is read-only", "set 'read only = no' for the share where it is configured"},
    {"recycle_bin", "it lies in a recycle bin", "restore what is to be found"},
    {"mount_point", "another file system, or another directory, is mounted there",
     "make what is mounted a share of its own"},
    {"reserved_name", "the name '%' on its way is kept for the system",
     "move the files to a directory of another name"},
    {"not_canonical", "it is not the path's plain form", "check the path and the rights on it"},
};

constexpr char kCanonicalRemedy[] = "use the plain form: %";

std::string Fill(const std::string& text, const std::string& detail) {
  const size_t at = text.find('%');
  return at == std::string::npos ? text : text.substr(0, at) + detail + text.substr(at + 1);
}

}  // namespace

std::string PathRuleName(PathRule rule) {
  return kRuleTexts[rule].name;
}

std::string DescribeVerdict(const PathVerdict& verdict) {
  return Fill(kRuleTexts[verdict.rule].reason, verdict.detail);
}

std::string RemedyOf(const PathVerdict& verdict) {
  const bool canonical_known = verdict.rule == kPathNotCanonical && !verdict.detail.empty();
  return Fill(canonical_known ? kCanonicalRemedy : kRuleTexts[verdict.rule].remedy, verdict.detail);
}

}  // namespace quarrox::fileindex
