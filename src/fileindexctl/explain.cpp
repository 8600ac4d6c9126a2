#include <unistd.h>

#include <iostream>
#include <string>

#include "command.h"
#include "common/error.h"
#include "common/file.h"
#include "common/json.h"
#include "common/sdk/share_path.h"
#include "fileindex/util.h"
#include "output.h"
#include "refusal.h"

namespace quarrox::ctl {
namespace {

constexpr const char* kFileTypeNames[] = {"document", "audio", "video", "photo", "other"};

struct Explanation {
  std::string path = {};        // on its volume
  std::string share = {};       // empty where no share holds it
  std::string share_path = {};  // as users see it; empty likewise
  std::string file_type = {};
  Refusal refusal = {};
};

bool HasShare(const std::string& full_path, std::string& share) {
  try {
    std::string share_dir;
    fileindex::GetShareNamePathByFullPath(share, share_dir, full_path);
    return true;
  } catch (const Error&) {
    return false;
  }
}

// What a person typed, as a full path: a relative one from here, a share path from its share.
std::string AsFullPath(const std::string& typed) {
  std::string share;
  std::string path = typed.front() == '/' ? typed : RealPath(".") + "/" + typed;
  if (IsFileExist(path) || HasShare(path, share)) return path;
  try {
    return fileindex::GetFullPath(path);
  } catch (const Error&) {
    return path;
  }
}

Explanation Explain(const std::string& typed) {
  Explanation result;
  result.path = AsFullPath(typed);
  if (HasShare(result.path, result.share)) {
    result.share_path = sdk::SharePathMgr::GetSharePath(result.path, sdk::User(), false);
  }
  result.file_type =
      IsDirExist(result.path, false) ? "directory" : kFileTypeNames[fileindex::GetFileTypeByFullPath(result.path)];
  result.refusal = RefusalOf(result.path);
  return result;
}

void PrintJson(const Explanation& explanation) {
  Json::Value object;
  object["path"] = explanation.path;
  object["share"] = explanation.share;
  object["share_path"] = explanation.share_path;
  object["file_type"] = explanation.file_type;
  object["indexable"] = !explanation.refusal;
  Describe(explanation.refusal, object);
  std::cout << toString(object) << '\n';
}

void PrintText(const Explanation& explanation) {
  std::cout << "path       " << Visible(explanation.path) << '\n';
  std::cout << "share      "
            << (explanation.share.empty() ? "none" : Visible(explanation.share + " (" + explanation.share_path + ")"))
            << '\n';
  std::cout << "type       " << explanation.file_type << '\n';
  if (!explanation.refusal) {
    std::cout << "indexable  yes\n";
    return;
  }
  std::cout << "indexable  no: " << Visible(explanation.refusal.reason) << " (rule " << explanation.refusal.rule
            << ")\n";
  std::cout << "remedy     " << Visible(explanation.refusal.remedy) << '\n';
}

}  // namespace

int ExplainPath(const Arguments& arguments) {
  const std::string& typed = arguments.operands().front();
  if (typed.empty()) throw UsageError("PATH is empty");
  const Explanation explanation = Explain(typed);
  if (arguments.Has("--json")) {
    PrintJson(explanation);
  } else {
    PrintText(explanation);
  }
  return kDone;
}

}  // namespace quarrox::ctl
