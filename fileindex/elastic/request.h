#pragma once

#include <json/json.h>

/// Requests to the search daemon: {"command": string, "data": {"id": INDEX, ...}}, or several of
/// them as {"compound": [...]}. Replies are {"success": bool, ...}. For the errors see
/// elastic_control.h.
namespace quivra::fileindex::elastic {

/// One attempt on a connection of its own. `response` becomes the parsed reply.
void SendRequest(Json::Value& response, const Json::Value& request);

/// Repeats the request for as long as the daemon is busy (1400, 1401), 15 to 19 minutes apart.
void SendRequestWithRetry(Json::Value& response, const Json::Value& request);

/// The same for a request whose reply holds nothing of interest.
void SendRequestNoResult(const Json::Value& request);

}  // namespace quivra::fileindex::elastic
