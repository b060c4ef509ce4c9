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
    QUIVRA_FAIL_IF(unit::kRequest, !conn.Connect(), Error(Error::kChannelFailed, "Connect failed"));
    if (!conn.Send(toString(request))) {
        Fail(unit::kRequest.Here(), "!conn.Send(req.toString())",
             Error(Error::kChannelFailed, "Send failed"));
    }
    response = Json::Value();
    std::string resp_raw;
    if (!conn.Recv(resp_raw) || !ParseReply(response, resp_raw)) {
        Fail(unit::kRequest.Here(),
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

/// What a batch's element says of its failure. What is missing or of another type counts as 0 and
/// empty: the others' failures are worth their log lines all the same.
Refusal ReadElement(const Json::Value& element) {
    Json::Value error;
    GetJsonValue(error, element, "error", false);
    Refusal refusal;
    GetJsonValue<int>(refusal.code, error, "code", false);
    GetJsonValue<std::string>(refusal.msg, error, "msg", false);
    return refusal;
}

/// Elements that failed are logged, and the batch counts as done, unless the daemon was too busy
/// for one: then the whole batch is to be sent again.
void CheckCompound(const Json::Value& response, const Json::Value& request) {
    bool has_fail = false;
    GetJsonValue<bool>(has_fail, response, "has_fail", false);
    const Json::Value* data = FindJsonMember(response, "data", false);
    if (!has_fail || data == nullptr || !data->isArray()) {
        return;
    }
    for (Json::ArrayIndex i = 0; i < data->size(); ++i) {
        bool success = false;
        GetJsonValue<bool>(success, (*data)[i], "success", false);
        if (success) {
            continue;
        }
        const Refusal refusal = ReadElement((*data)[i]);
        if (IsBusy(refusal.code)) {
            Fail(unit::kRequest.Here(), "1400 == code || 1401 == code",
                 Error(refusal.code, refusal.msg));
        }
        LogError(unit::kRequest.Here(), "Compound failed: %s (%d) %s",
                 toString(request["compound"][i]).c_str(), refusal.code, refusal.msg.c_str());
    }
}

}  // namespace

void SendRequest(Json::Value& response, const Json::Value& request) {
    Exchange(response, request);
    if (!response["success"].asBool()) {
        const Refusal refusal = ReadRefusal(response);
        Fail(unit::kRequest.Here(), "!res[\"success\"].asBool()",
             Error(refusal.code, "Request failed, msg=" + refusal.msg));
    }
    if (request.isMember("compound")) {
        CheckCompound(response, request);
    }
}

void SendRequestWithRetry(Json::Value& response, const Json::Value& request) {
    bool notified = false;  // once per call: the next call of the same hour tells them again
    for (unsigned int attempt = 1;; ++attempt) {
        try {
            SendRequest(response, request);
            return;
        } catch (const Error& error) {
            if (!IsBusy(error.code)) {
                throw;
            }
        }
        LogError(unit::kRequest.Here(),
                 "Retry[%u] since kestoelasticd is busy. Command: %s, db: %s", attempt - 1,
                 request["command"].asString().c_str(), request["data"]["id"].asString().c_str());
        if (attempt > kAttemptsBeforeNotice && !notified) {
            NotifyLackOfMemory();
            notified = true;
        }
        // Long, because a daemon short of memory stays so for a while, and at random, so that all
        // workers do not come back at once.
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
