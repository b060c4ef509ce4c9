#include "fileindex/elastic/request.h"

#include <unistd.h>

#include <cstdlib>
#include <string>

#include <kesto/daemon_socket.h>

#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "fileindex/elastic/protocol.h"
#include "fileindex/index_mgr.h"

namespace quivra::fileindex::elastic {
namespace {

constexpr unsigned int kAttemptsBeforeNotice = 10;
constexpr unsigned int kRetryBaseSeconds = 900;
constexpr unsigned int kRetryStepSeconds = 60;
constexpr int kRetrySteps = 5;

bool IsBusy(int code) {
    return code == kOutOfMemory || code == kBusy;
}

bool ParseReply(Json::Value& response, const std::string& text) {
    if (!fromString(response, text)) {
        response = Json::Value();  // what a failed parse leaves is not for an error text
        return false;
    }
    return response.isObject() && response.isMember("success") && response["success"].isBool();
}

void Exchange(Json::Value& response, const Json::Value& request) {
    kestodaemon::DomainSockConnection conn(kSearchDaemonSocketPath);
    if (!conn.Connect()) {
        Fail({"elastic_control", __LINE__}, "!conn.Connect()",
             Error(Error::kChannelFailed, "Connect failed"));
    }
    if (!conn.Send(toString(request))) {
        Fail({"elastic_control", __LINE__}, "!conn.Send(req.toString())",
             Error(Error::kChannelFailed, "Send failed"));
    }
    response = Json::Value();
    std::string resp_raw;
    if (!conn.Recv(resp_raw) || !ParseReply(response, resp_raw)) {
        Fail({"elastic_control", __LINE__},
             "!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") || "
             "!res[\"success\"].isBool()",
             Error(Error::kChannelFailed, "Recv failed, res=" + toString(response)));
    }
}

struct Refusal {
    int code = 0;
    std::string msg;
};

/// The "error" member of a failed reply. Throws Error 120 when it is malformed.
Refusal ReadRefusal(const Json::Value& reply) {
    Json::Value error;
    GetJsonValue(error, reply, "error", false);
    Refusal refusal;
    GetJsonValue<int>(refusal.code, error, "code", true);
    GetJsonValue<std::string>(refusal.msg, error, "msg", true);
    return refusal;
}

/// Elements that failed are logged, and the batch counts as done, unless the daemon was too busy
/// for one: then the whole batch is to be sent again.
void CheckCompound(const Json::Value& response, const Json::Value& request) {
    bool has_fail = false;
    GetJsonValue<bool>(has_fail, response, "has_fail", response.isMember("has_fail"));
    if (!has_fail) {
        return;
    }
    const Json::Value& data = *FindJsonMember(response, "data", true);
    if (!data.isArray()) {
        Fail({"elastic_control", __LINE__}, "!res[\"data\"].isArray()",
             Error(Error::kBadArgument, "Not an array" + AppendData(response)));
    }
    for (Json::ArrayIndex i = 0; i < data.size(); ++i) {
        bool success = false;
        GetJsonValue<bool>(success, data[i], "success", true);
        if (success) {
            continue;
        }
        const Refusal refusal = ReadRefusal(data[i]);
        if (IsBusy(refusal.code)) {
            Fail({"elastic_control", __LINE__}, "1400 == code || 1401 == code",
                 Error(refusal.code, refusal.msg));
        }
        LogError({"elastic_control", __LINE__}, "Compound failed: %s (%d) %s",
                 toString(request["compound"][i]).c_str(), refusal.code, refusal.msg.c_str());
    }
}

}  // namespace

void SendRequest(Json::Value& response, const Json::Value& request) {
    Exchange(response, request);
    if (!response["success"].asBool()) {
        const Refusal refusal = ReadRefusal(response);
        Fail({"elastic_control", __LINE__}, "!res[\"success\"].asBool()",
             Error(refusal.code, "Request failed, msg=" + refusal.msg));
    }
    if (request.isMember("compound")) {
        CheckCompound(response, request);
    }
}

void SendRequestWithRetry(Json::Value& response, const Json::Value& request) {
    bool notified = false;
    for (unsigned int attempt = 1;; ++attempt) {
        try {
            SendRequest(response, request);
            return;
        } catch (const Error& error) {
            if (!IsBusy(error.code)) {
                throw;
            }
        }
        LogError({"elastic_control", __LINE__},
                 "Retry[%u] since kestoelasticd is busy. Command: %s, db: %s", attempt - 1,
                 request["command"].asString().c_str(), request["data"]["id"].asString().c_str());
        if (attempt > kAttemptsBeforeNotice && !notified) {
            NotifyLackOfMemory();
            notified = true;
        }
        unsigned int left =
            static_cast<unsigned int>(std::rand() % kRetrySteps) * kRetryStepSeconds +
            kRetryBaseSeconds;
        while (left > 0) {
            left = sleep(left);  // a signal handler cuts it short
        }
    }
}

void SendRequestNoResult(const Json::Value& request) {
    Json::Value response;
    SendRequestWithRetry(response, request);
}

}  // namespace quivra::fileindex::elastic
