#pragma once

#include <json/json.h>

#include "common/log.h"

/// Requests to the search daemon: {"command": string, "data": {"id": INDEX, ...}}, or several of
/// them as {"compound": [...]}. Replies are {"success": bool, ...}. For the errors see
/// elastic_control.h.
namespace quivra::fileindex::elastic {

/// The client logs under one given name; each source has a thousand of its own.
namespace unit {

inline constexpr LogUnit kDocuments{"elastic_control", 0};
inline constexpr LogUnit kMappings{"elastic_control", 1000};
inline constexpr LogUnit kRequest{"elastic_control", 2000};

}  // namespace unit

/// One attempt on a connection of its own. `response` becomes the parsed reply.
void SendRequest(Json::Value& response, const Json::Value& request);

/// Repeats the request for as long as the daemon is busy (1400, 1401), 15 to 19 minutes apart.
void SendRequestWithRetry(Json::Value& response, const Json::Value& request);

/// The same for a request whose reply holds nothing of interest.
void SendRequestNoResult(const Json::Value& request);

}  // namespace quivra::fileindex::elastic
