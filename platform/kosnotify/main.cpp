// vexokosnotify: shows a notice to the administrators of a machine without a desktop for them.
#include <syslog.h>
#include <unistd.h>

#include <cstdio>

#include "delivery.h"
#include "linux/platform_conf.h"
#include "notice.h"

namespace {

using namespace quarrox::kosnotify;

constexpr char kSendmail[] = "/usr/sbin/sendmail";
constexpr char kPath[] = "PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin";

// How long the log may take, which waits for nobody unless its daemon is stuck: whoever calls must not wait with it.
constexpr unsigned int kLogSeconds = 5;

std::string HostName() {
  char name[256] = "";
  gethostname(name, sizeof(name) - 1);
  return name;
}

Delivery Mail(const std::string& address, const Notice& notice) {
  return {{kSendmail, "-i", "--", address},
          {kPath},
          "To: " + address + "\nSubject: " + notice.title + " on " + HostName() +
              "\nMIME-Version: 1.0\nContent-Type: text/plain; charset=UTF-8\nContent-Transfer-Encoding: 8bit\n"
              "Auto-Submitted: auto-generated\n\n" +
              notice.text + "\n"};
}

Delivery Command(const std::string& command, const Notice& notice) {
  return {{command},
          {kPath, "NOTICE_APPLICATION=" + notice.application, "NOTICE_RECIPIENT=" + notice.recipient,
           "NOTICE_KEY=" + notice.key, "NOTICE_TITLE=" + notice.title, "NOTICE_TEXT=" + notice.text},
          ""};
}

int Show(const Notice& notice) {
  openlog("vexokosnotify", LOG_PID, LOG_DAEMON);
  alarm(kLogSeconds);
  syslog(LOG_WARNING, "%s, to %s: %s", notice.title.c_str(), notice.recipient.c_str(), notice.text.c_str());
  const platform::PlatformConf conf = platform::ReadPlatformConf();
  alarm(conf.notice_time + kLogSeconds);
  std::vector<Delivery> deliveries;
  if (!conf.notice_mail.empty()) deliveries.push_back(Mail(conf.notice_mail, notice));
  if (!conf.notice_command.empty()) deliveries.push_back(Command(conf.notice_command, notice));
  return Deliver(deliveries, std::chrono::seconds(conf.notice_time)) ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    const std::vector<std::string> words(argv + 1, argv + argc);
    if (words != std::vector<std::string>{"--help"}) return Show(ParseNotice(words));
    fputs(kUsage, stdout);
    return 0;
  } catch (const UsageError& error) {
    fprintf(stderr, "vexokosnotify: %s\n\n%s", error.what(), kUsage);
    return 2;
  }
}
