#include "programs/fileindexd/commands.h"

#include <iterator>

#include "common/error.h"
#include "common/json.h"

namespace fileindexd {

using quivra::Error;

namespace {

struct CommandName {
    const char* name;
    Command::Type type;
};

constexpr CommandName kNames[] = {
    {"pause", Command::Type::kPause},
    {"resume", Command::Type::kResume},
    {"notify_setting_changed", Command::Type::kSettingChanged},
    {"worker_create", Command::Type::kWorkerCreate},
    {"worker_delete", Command::Type::kWorkerDelete},
    {"state", Command::Type::kState},
    {"failed", Command::Type::kFailed},
    {"retry", Command::Type::kRetry},
};

Command::Type TypeOf(const std::string& name) {
    for (const CommandName& known : kNames) {
        if (name == known.name) {
            return known.type;
        }
    }
    throw Error(Error::kBadArgument, "Unknown command: " + name);
}

std::string ReadShare(const Json::Value& data, const char* member) {
    std::string share;
    quivra::GetJsonValue(share, data, member, true);
    // It becomes part of file names.
    if (share.empty() || share == "." || share == ".." ||
        share.find_first_of(std::string("/\0", 2)) != std::string::npos) {
        throw Error(Error::kBadArgument, "Not a share name: " + share);
    }
    return share;
}

}  // namespace

Command ParseCommand(const std::string& request) {
    Json::Value json;
    if (!quivra::fromString(json, request)) {
        throw Error(Error::kBadArgument, "The request is not JSON");
    }
    std::string name;
    Json::Value data;
    quivra::GetJsonValue(name, json, "type", true);
    quivra::GetJsonValue(data, json, "data", false);
    Command command;
    command.type = TypeOf(name);
    if (command.type == Command::Type::kPause) {
        long long resume_time = 0;
        quivra::GetJsonValue(resume_time, data, "resume_time", true);
        command.resume_time = resume_time;
    } else if (command.type == Command::Type::kFailed || command.type == Command::Type::kRetry) {
        command.share = ReadShare(data, "share");
    } else if (command.type != Command::Type::kResume && command.type != Command::Type::kState) {
        command.share = ReadShare(data, "share_name");
    }
    return command;
}

std::string SuccessReply() {
    return R"({"success":true})";
}

std::string DataReply(const Json::Value& data) {
    Json::Value reply;
    reply["success"] = true;
    reply["data"] = data;
    return quivra::toString(reply);
}

std::string ErrorReply(int code, const std::string& message) {
    Json::Value reply;
    reply["success"] = false;
    reply["error"]["code"] = code;
    reply["error"]["msg"] = message;
    return quivra::toString(reply);
}

}  // namespace fileindexd
