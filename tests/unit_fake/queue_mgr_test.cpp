#include "fileindex/queue_mgr.h"

#include <sstream>
#include <thread>

#include <gtest/gtest.h>

#include "common/lock_file.h"
#include "common/queue_file.h"
#include "fileindex/folder_mgr.h"
#include "support/call_capture.h"
#include "support/errors.h"
#include "support/fake_platform/fake_platform.h"
#include "support/private_machine.h"
#include "support/temp_dir.h"

namespace quarrox::fileindex {
namespace {

TEST(QueueMgrTest, WhatTheLastPassLeftIsDrainedFirstAndWhoHoldsALockIsWaitedFor) {
  const support::TempDir dir;
  QueueMgr queue(dir / "queue");
  std::string paths;
  const auto drain = [&] {
    queue.ProcessOP([&](const auto& op) { paths += op->node.lock()->GetPath(); }, true);
    return std::exchange(paths, "");
  };
  EXPECT_TRUE(!queue.PrepareTmpQueue() && drain().empty() && queue.DeleteTmp() == -1);
  for (const std::string path : {"/a", "/b"}) {
    AppendToQueue(dir / "queue", "{\"event\":4,\"path\":\"" + path + "\"}\n");
    EXPECT_TRUE(queue.PrepareTmpQueue() && drain() == "/a");
  }
  EXPECT_TRUE(queue.DeleteTmp() == 0 && queue.PrepareTmpQueue() && drain() == "/b");
  for (const char* locked : {"queue.tmp", "queue"}) {
    queue.DeleteTmp();
    auto lock = std::make_unique<LockFile>(dir / locked, true);
    support::ResetCalls(1, EINTR);
    std::thread consumer([&] { EXPECT_EQ((queue.PrepareTmpQueue(), drain()), "/late") << locked; });
    while (support::Flocks().size() < 2) std::this_thread::yield();
    support::WriteText(dir / locked, R"({"event":4,"path":"/late"})");
    lock.reset();
    consumer.join();
  }
  const std::string q = dir / std::string(255, 'q');
  AppendToQueue(q, "\n");
  EXPECT_EQ(support::ReasonOf(502, [&] { QueueMgr(q).PrepareTmpQueue(); }), "rename failed, reason=File name too long");
}

TEST(QueueMgrTest, PendingEventsAreFoundByTheFolderThatTheyConcern) {
  if (!support::PrivateMachine().Enter()) GTEST_SKIP() << "no machine of one's own";
  const support::TempDir dir;
  const QueueMgr queue(dir / "queue");
  std::filesystem::remove(kFileIndexFoldersCfgPath);
  support::FakePlatform::Get().Reset();
  support::FakePlatform::Get().shares = {{.name = "s", .path = "/v/s"}};
  FolderMgr folders;
  for (std::shared_ptr<Folder> diff; const char* path : {"/s/m", "/s/m/r", "/s/op"})
    folders.Upsert(diff, std::make_shared<Folder>(path, "n", "", "", true, true, true, true, false, false));
  folders.Save();
  // Each behind the folders that it concerns: in capitals where a reindex is pending, too.
  std::istringstream lines(
      R"(m{"event":64,"path":"/v/s/m/a"} r{"event":64,"path":"/v//s/m\/r//a/"} {"event":64,"path":"/v/s/mm"}
    m{"path":"/v//s//m/","event":4} mp{"event":256,"path":"/v/s/m/b","path_old":"/v/s/op/b"} MRP{"event":65536.0,"path":"/"}
    mr{"event":256,"path":"/v/t","path_old":"/v/s//m/"} {"event":256,"path":"t","path_old":"/v/s/m"} {"event":4,"path":"/v/s"}
    MR{"event":65536,"path":"//v/s/m/"} {"event":65536,"path":"/v/s/o/p"} mrp{"event":65540,"path":"/v/s"}
    MRP{"event":64,"path":"/v/s","\u0065vent":65536} mrp{"event":512,"path":"/v/t"} {"event":65536,"path":"/v/s/m"}}
    mrp{"event":64,"is_dir":true,"path":"/v/s"} mr{"event":128,"is_dir":true,"path":"/v/s/m"} {"event":128,"path":"/v/s"}
    mr{"event":4,"path":"/v/s/m/r/a"};{"event":4,"path":"/v/s/m/z"}
    {"event":65536,"path":"/v/s/o"} {"event":65536,"path":""} {"event":64,"path":"/v/s/m/)" +
      std::string(70000, 'x') + R"("}
    {"event":65536,"path":"/v/s/op","data":")" +
      std::string(size_t{17} << 20, 'x') + "\"}");
  for (std::string line; lines >> line;) {
    std::replace(line.begin(), line.end(), ';', '\n');
    const std::string expected = line.substr(0, line.find('{'));
    support::WriteText(dir / (line[0] == 'm' ? "queue" : "queue.tmp"), "bad\n" + line.substr(expected.size()));
    std::string found;
    for (const std::string path : {"/v/s/m", "/v/s/m/r", "/v/s/op"})
      if (const int lower = queue.IsFullPathHasReindex(path) ? 0 : 32; queue.IsFullPathProcessing(path))
        found += static_cast<char>(toupper(path.back()) + lower);
    EXPECT_EQ(found, expected) << line.substr(0, 99);
    for (const char* name : {"queue", "queue.tmp"}) std::filesystem::remove(dir / name);
  }
  support::WriteText(kFileIndexFoldersCfgPath, "{}");
  EXPECT_FALSE(queue.IsFullPathProcessing("/v/s/m"));  // without a queue nobody needs the list
}

}  // namespace
}  // namespace quarrox::fileindex
