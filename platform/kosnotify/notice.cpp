#include "notice.h"

#include <algorithm>

namespace quarrox::kosnotify {
namespace {

// What the keys of titles and messages stand for.
struct Text {
  const char* key;
  const char* text;
};

constexpr Text kTexts[] = {
    {"app:displayname", "Full-text index"},
    {"error:index_no_space",
     "Indexing stopped because there is no room left on the disk. Make room on it; fileindexctl folder summary says "
     "which folders wait."},
    {"error:lack_of_memory",
     "Indexing waits because the search engine has no memory left. It goes on by itself once there is some; see "
     "journalctl -u vexoelasticd."},
};

// Without control characters: a text goes into one line of a log, and into the head of a mail.
std::string OneLine(std::string text) {
  std::replace_if(
      text.begin(), text.end(), [](char c) { return (c >= 0 && c < ' ') || c == '\x7f'; }, ' ');
  return text;
}

std::string TextOf(const std::string& key) {
  const auto* known =
      std::find_if(std::begin(kTexts), std::end(kTexts), [&](const Text& row) { return key == row.key; });
  return known == std::end(kTexts) ? OneLine(key) : known->text;
}

}  // namespace

const char* const kUsage =
    "Usage: vexokosnotify [-c APPLICATION] [-b BOOL] [-e BOOL] RECIPIENT TITLE MESSAGE [FILLING...]\n"
    "\n"
    "Writes a notice to the system log and, as /etc/vexo/platform.conf says, mails it or runs a command for it.\n"
    "\n"
    "  -c APPLICATION   whose notice it is\n"
    "  -b, -e BOOL      how a desktop shows it; without meaning here, where there is none\n"
    "  RECIPIENT        whom it is for\n"
    "  TITLE, MESSAGE   keys of texts; one that is not known is the text itself\n"
    "  FILLING          what a desktop fills the message with: a link, which has no place here\n";

Notice ParseNotice(const std::vector<std::string>& words) {
  Notice notice;
  auto word = words.begin();
  for (; word != words.end() && word->size() == 2 && word->front() == '-'; ++word) {
    const char option = (*word)[1];
    if (option == '-') {
      ++word;
      break;
    }
    if (option != 'c' && option != 'b' && option != 'e') throw UsageError("there is no option " + *word);
    if (++word == words.end()) throw UsageError(std::string("option -") + option + " needs a value");
    if (option == 'c') notice.application = OneLine(*word);
  }
  if (words.end() - word < 3) throw UsageError("recipient, title or message is missing");
  notice.recipient = OneLine(word[0]);
  notice.title = TextOf(word[1]);
  notice.key = OneLine(word[2]);
  notice.text = TextOf(word[2]);
  return notice;
}

}  // namespace quarrox::kosnotify
