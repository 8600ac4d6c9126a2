// How the engine's commands are sent; for the sources of elastic_control alone.
#pragma once

#include <string>

#include <json/json.h>

namespace quarrox::fileindex::elastic {

Json::Value MakeRequest(const std::string& command, const Json::Value& data);

// SendRequestImpl until the engine is ready for the request; throws what that throws otherwise.
void SendElasticRequest(Json::Value& res, const Json::Value& req);

// The same without the response.
void SendElasticCommand(const Json::Value& req);

}  // namespace quarrox::fileindex::elastic
