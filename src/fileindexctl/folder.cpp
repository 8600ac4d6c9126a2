#include <algorithm>
#include <cstdint>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "command.h"
#include "common/json.h"
#include "fileindex/folder_mgr.h"
#include "fileindex/folder_pauses.h"
#include "output.h"
#include "typed_path.h"

namespace quarrox::ctl {
namespace {

using fileindex::Folder;
using fileindex::FolderMgr;
using fileindex::FolderPauses;

const std::vector<std::string>& SortKeys() {
  static const std::vector<std::string> keys = {"path", "name", "document", "audio", "video", "photo"};
  return keys;
}

const char* YesNo(bool value) {
  return value ? "yes" : "no";
}

void PrintRow(const char* name, const std::string& value) {
  std::cout << name << Visible(value) << '\n';
}

std::string PausedText(const Folder& folder, const FolderPauses& pauses) {
  const int64_t end = pauses.EndOf(folder).value_or(0);
  return end == 0 ? YesNo(folder.IsPaused()) : "until " + LocalTime(end);
}

void PrintFolder(const Folder& folder, const FolderPauses& pauses) {
  PrintRow("path        ", folder.GetPath());
  PrintRow("name        ", folder.GetName());
  PrintRow("types       ", TypesOf(folder));
  PrintRow("group       ", folder.GetGroup());
  PrintRow("owner       ", folder.GetOwner());
  PrintRow("privileged  ", YesNo(folder.IsPrivileged()));
  PrintRow("paused      ", PausedText(folder, pauses));
}

// "resume_time" says until when a folder is paused by itself, 0 for without end.
Json::Value AsJson(const Folder& folder, const FolderPauses& pauses) {
  Json::Value data = folder.GetData();
  if (const auto end = pauses.EndOf(folder)) data["resume_time"] = Json::Int64{*end};
  return data;
}

}  // namespace

std::string TypesOf(const Folder& folder) {
  std::string types;
  for (const auto& [has, type] : {std::pair(folder.HasDocument(), "document"), std::pair(folder.HasAudio(), "audio"),
                                  std::pair(folder.HasVideo(), "video"), std::pair(folder.HasPhoto(), "photo")}) {
    if (has) types.append(types.empty() ? "" : ",").append(type);
  }
  return types.empty() ? "none" : types;
}

int FolderList(const Arguments& arguments) {
  const std::string sort_by = arguments.Value("--sort", "path");
  if (std::find(SortKeys().begin(), SortKeys().end(), sort_by) == SortKeys().end()) {
    throw UsageError("option --sort knows no key '" + sort_by + "'");
  }
  const size_t offset = arguments.Number("--offset", 0);
  const size_t limit = arguments.Number("--limit", SIZE_MAX);
  std::vector<std::shared_ptr<Folder>> folders;
  size_t total = 0;
  FolderMgr().List(folders, total, offset, limit, sort_by, arguments.Has("--desc") ? "desc" : "asc",
                   arguments.Value("--group", fileindex::kAll), arguments.Value("--keyword", ""));
  const FolderPauses pauses;
  if (arguments.Has("--json")) {
    for (const auto& folder : folders) std::cout << toString(AsJson(*folder, pauses)) << '\n';
    return kDone;
  }
  std::vector<std::vector<std::string>> rows = {{"PATH", "NAME", "TYPES", "GROUP", "PAUSED"}};
  for (const auto& folder : folders) {
    rows.push_back({Visible(folder->GetPath()), Visible(folder->GetName()), TypesOf(*folder),
                    Visible(folder->GetGroup()), PausedText(*folder, pauses)});
  }
  if (rows.size() > 1) PrintTable(std::cout, rows);
  std::cout.flush();
  if (folders.size() < total) std::cerr << "fileindexctl: " << folders.size() << " of " << total << " folders\n";
  if (total == 0) std::cerr << "fileindexctl: there are no such folders\n";
  return kDone;
}

int FolderGet(const Arguments& arguments) {
  const FolderMgr folder_mgr;
  const std::string path = FolderPath(folder_mgr, arguments.operands().front());
  std::shared_ptr<Folder> folder;
  folder_mgr.Get(folder, path);
  if (arguments.Has("--json")) {
    std::cout << toString(AsJson(*folder, FolderPauses())) << '\n';
  } else {
    PrintFolder(*folder, FolderPauses());
  }
  return kDone;
}

int FolderGroups(const Arguments& arguments) {
  for (const std::string& group : FolderMgr().GetGroups()) {
    if (arguments.Has("--json")) {
      Json::Value object;
      object["group"] = group;
      std::cout << toString(object) << '\n';
    } else {
      std::cout << Visible(group) << '\n';
    }
  }
  return kDone;
}

}  // namespace quarrox::ctl
