// A test of the operations on the index, over a machine with a few shares and indexed folders.
#pragma once

#include <cerrno>
#include <filesystem>
#include <memory>
#include <optional>
#include <regex>
#include <string>

#include <gmock/gmock.h>

#include "fileindex/folder_mgr.h"
#include "fileindex/status_mgr.h"
#include "support/engine_test.h"
#include "support/fake_daemon.h"
#include "support/temp_dir.h"

namespace quarrox::support {

// The shares docs, docsx and homes on the volume /tmp/v and music on /tmp/w: their directories are missing, the places
// of their indexes are there. Folders are /docs/a, /docsx/, /homes/al, /docs/b and /music/; that of the homes is al's,
// the others are ann's.
class IndexMgrTest : public EngineTest {
 protected:
  void SetUp() override {
    EngineTest::SetUp();
    if (IsSkipped()) return;
    for (const char* place : {"/var/packages", "/tmp/v", "/tmp/w"}) std::filesystem::remove_all(place);
    fileindex::FolderMgr folders;
    for (const std::string path : {"/v/docs/a", "/v/docsx/", "/v/homes/al", "/v/docs/b", "/w/music/"}) {
      const std::filesystem::path dir = std::filesystem::path("/tmp" + path).parent_path();
      world_.AddShare({.name = dir.filename(), .path = dir});
      std::filesystem::create_directories(dir.parent_path() / "@fileindex" / dir.filename() / "db");
      auto folder = std::make_shared<fileindex::Folder>(path.substr(2), "n", path == "/v/homes/al" ? "al" : "ann", "",
                                                        true, true, true, true, false, false);
      folders.Upsert(folder, folder);
    }
    folders.Save();
    daemon_.emplace();
    world_.ForgetCalls();
    errno = 0;
  }

  // What was told to the daemons, the engine and the machine since the last time, in order: "worker_create docs; ".
  // Paths begin below the index places of /tmp/v.
  std::string Told() {
    std::string told;
    for (const std::string& call : world_.calls()) {
      const std::string function = call.substr(0, call.find('('));
      const std::string arguments = call.substr(function.size() + 1, call.size() - function.size() - 2);
      if (function == "Daemon" || function == "SockConnection::Send") {
        Json::Value json;
        EXPECT_TRUE(fromString(json, arguments));
        const Json::Value& data = json["data"];
        told +=
            json.get("command", json["type"]).asString() + " " + data.get("id", data["share_name"]).asString() + "; ";
      } else if (function.starts_with("Monitor") || function.starts_with("VLIBService")) {
        told += function.substr(function.rfind(':') + 1) + " " + arguments.substr(0, arguments.find(',')) + "; ";
      } else if (function == "VLIBCExec") {
        told += arguments + "; ";
      }
    }
    world_.ForgetCalls();
    return std::regex_replace(told, std::regex("/tmp/v/@fileindex/"), "");
  }

  // Each folder of the list, with "-" where it is paused, and its volume mark.
  static std::string Folders() {
    std::string text;
    for (const auto& folder : fileindex::FolderMgr().GetFolders()) {
      text += folder->GetPath() + (folder->IsPaused() ? "-" : "") + folder->GetVolumeToBeClean() + " ";
    }
    return text;
  }

  static std::string QueuePath(const std::string& share) { return "/tmp/v/@fileindex/" + share + "/queue"; }

  // What is in the queue of a share, which is then gone.
  static std::string Taken(const std::string& share) {
    const std::string text = ReadText(QueuePath(share));
    std::filesystem::remove(QueuePath(share));
    return text;
  }

  std::optional<FakeDaemon> daemon_;
};

}  // namespace quarrox::support
