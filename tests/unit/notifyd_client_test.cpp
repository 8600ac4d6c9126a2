#include "linux/notifyd_client.h"

#include <gtest/gtest.h>

#include "common/json.h"
#include "support/temp_dir.h"

TEST(NotifydClient, KeepsOneConfigurationAQueueAndRefusesWhatTheDaemonCouldNotRead) {
  const quarrox::support::TempDir dir;
  const std::string queue = dir / "@fileindex/\xff/queue";
  const auto upsert = [&](const std::string& application, const std::string& watches) {
    Json::Value config;
    EXPECT_TRUE(quarrox::fromString(config, "{\"queue\":\"" + queue + "\",\"config\":" + watches + "}"));
    return platform::UpsertMonitor(dir / "d", config, application, VEXO::VEXONOTIFYD::MONITOR_QUEUE_TYPE_APPLICATION);
  };
  const auto files = [&] { return std::distance(std::filesystem::directory_iterator(dir / "d"), {}); };
  const std::string watches = "[{\"ignore\":[\"#\"],\"mask\":3,\"path\":\"/v\"}]";
  EXPECT_TRUE(upsert("app", "[]") && upsert("app", watches) && files() == 1);
  EXPECT_EQ(std::filesystem::status(dir / "@fileindex/\xff").permissions(), std::filesystem::perms{0700});
  EXPECT_EQ(quarrox::support::ReadText(std::filesystem::directory_iterator(dir / "d")->path()),
            "{\"application\":\"app\",\"config\":" + watches + ",\"queue\":\"" + queue + "\",\"type\":0}\n");
  EXPECT_FALSE(upsert("a/b", "[]") || upsert(".a", "[]") || upsert("a", "{}") || upsert("a", R"([{"path":"/v"}])"));
  for (const char* application : {"other", "app"}) EXPECT_TRUE(platform::DeleteMonitor(dir / "d", queue, application));
  EXPECT_EQ(files(), 0);
}
