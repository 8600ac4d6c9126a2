#include "refusal.h"

#include "common/error.h"
#include "common/strings.h"

namespace quarrox::ctl {
namespace {

// Full paths are made from the share's name, so that nothing in such a share would be found under its own path.
Refusal NameDiffers(const sdk::SDKShare& share) {
  const std::string directory = Basename(share.GetPath());
  if (directory == share.GetName()) return {};
  return {"share_directory",
          "the share " + share.GetName() + " lies in a directory of another name, " + directory +
              ", and its paths are made from its name",
          "give the directory and the share the same name"};
}

}  // namespace

Refusal AsRefusal(const fileindex::PathVerdict& verdict) {
  return {fileindex::PathRuleName(verdict.rule), fileindex::DescribeVerdict(verdict), fileindex::RemedyOf(verdict)};
}

Refusal RefusalOf(const sdk::SDKShare& share) {
  if (share.IsLocked()) return AsRefusal({fileindex::kPathShareLocked, share.GetName()});
  if (share.IsReadOnly()) return AsRefusal({fileindex::kPathShareReadOnly, share.GetName()});
  return NameDiffers(share);
}

Refusal RefusalOf(const std::string& full_path) {
  try {
    const fileindex::PathVerdict verdict = fileindex::JudgeFullPath(full_path);
    if (verdict.rule != fileindex::kPathAccepted) return AsRefusal(verdict);
    std::string name;
    std::string share_dir;
    fileindex::GetShareNamePathByFullPath(name, share_dir, full_path);
    return NameDiffers(sdk::SDKShare(name));
  } catch (const Error& error) {
    if (error.code != kErrSystem) throw;
    return {"no_share", "no share holds it", "see 'fileindexctl share list'; add a share to /etc/vexo/shares.conf"};
  }
}

void Describe(const Refusal& refusal, Json::Value& object) {
  object["rule"] = refusal.rule;
  object["reason"] = refusal.reason;
  object["remedy"] = refusal.remedy;
}

}  // namespace quarrox::ctl
