// An engine with an index that holds a little of everything, for fuzzers.
#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "common/json.h"
#include "engine.h"
#include "fileindex/elastic_control.h"
#include "server_sender.h"
#include "support/temp_dir.h"

namespace quarrox::support {

class FuzzEngine {
 public:
  FuzzEngine() : engine_(directory_ / "data") {
    Json::Value data;
    data["id"] = "i";
    data["path"] = directory_ / "index";
    data["mappings"] = fileindex::elastic::GetFileIndexMappings();
    Send("index_create", data);
    for (int number = 0; number < 30; ++number) {
      const std::string path = "/v/" + std::to_string(number % 3) + "/File " + std::to_string(number) + ".txt";
      data["doc_id"] = path;
      Json::Value& fields = data["data"] = Json::Value(Json::objectValue);
      fields["VEXOMDPath"] = path;
      fields["VEXOMDSearchFileName"] = path.substr(path.rfind('/') + 1);
      fields["VEXOMDTextContent"] = "some t\xc3\xa9xt \xe6\xbc\xa2\xe5\xad\x97 number " + std::to_string(number);
      fields["VEXOMDFSSize"] = number;
      fields["VEXOMDDurationSecond"] = number * 0.5;
      Send("document_upsert_by_id", data);
    }
    Send("commit", data);
  }

  std::string directory() const { return directory_.path(); }

  void Search(const Json::Value& qsl) {
    Json::Value data;
    data["id"] = "i";
    data["query"]["qsl"] = qsl;
    data["query"]["size"] = 5;
    Send("document_get_by_query", data);
  }

  // Aborts unless the answer is a response.
  void Ask(const std::string& request) {
    elasticd::Answer answer(directory_.path());
    if (const auto rest = engine_.Handle(request, answer, make_way_)) rest();
    Json::Value response;
    if (!fromString(response, Text(answer)) || !response["success"].isBool()) abort();
  }

 private:
  void Send(const char* command, const Json::Value& data) {
    Json::Value request;
    request["command"] = command;
    request["data"] = data;
    Ask(toString(request));
  }

  static std::string Text(elasticd::Answer& answer) {
    int ends[2];
    std::string text(answer.size(), '\0');
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) abort();
    const int room = static_cast<int>(answer.size()) + 4096;
    setsockopt(ends[0], SOL_SOCKET, SO_SNDBUFFORCE, &room, sizeof(room));
    const bool sent = elasticd::AnswerSender(answer).Send(ends[0]) == elasticd::AnswerSender::Progress::kDone;
    if (!sent || recv(ends[1], text.data(), 4, MSG_WAITALL) != 4) abort();
    if (recv(ends[1], text.data(), text.size(), MSG_WAITALL) != static_cast<ssize_t>(text.size())) abort();
    close(ends[0]);
    close(ends[1]);
    return text;
  }

  TempDir directory_;
  elasticd::Engine engine_;
  const elasticd::Engine::MakeWay make_way_ = [] {};
};

}  // namespace quarrox::support
