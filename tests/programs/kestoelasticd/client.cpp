#include "tests/programs/kestoelasticd/client.h"

#include <gtest/gtest.h>
#include <kesto/daemon_socket.h>

#include "common/json.h"

namespace elasticd {

std::string SendToSocket(const std::string& socket_path, const std::string& request) {
    kestodaemon::DomainSockConnection connection(socket_path);
    std::string reply;
    const bool answered =
        connection.Connect() && connection.Send(request) && connection.Recv(reply);
    return answered ? reply : std::string();
}

Json::Value ParseJson(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(text.empty() || quivra::fromString(value, text)) << text;
    return value;
}

Json::Value Client::Ask(const Json::Value& request) const {
    return ParseJson(transport_(quivra::toString(request)));
}

Json::Value Client::Command(const std::string& command, const Json::Value& data) const {
    Json::Value request;
    request["command"] = command;
    request["data"] = data;
    request["data"]["id"] = index;
    return Ask(request);
}

int Client::Code(const std::string& command, const Json::Value& data) const {
    const Json::Value reply = Command(command, data);
    if (reply.isNull()) {
        return -1;
    }
    EXPECT_TRUE(reply["success"].isBool()) << reply;
    return reply["success"].asBool() ? 0 : reply["error"]["code"].asInt();
}

int Client::Create(const std::string& path, const Json::Value& mappings) const {
    Json::Value data;
    data["path"] = path;
    data["settings"] = Json::objectValue;
    data["mappings"] = mappings;
    return Code("index_create", data);
}

int Client::Document(const std::string& command, const std::string& id,
                     const std::string& fields) const {
    Json::Value data;
    data["doc_id"] = id;
    data["data"] = ParseJson(fields);
    return Code(command, data);
}

Json::Value Client::Query(const std::string& query) const {
    Json::Value data;
    data["query"] = ParseJson(query);
    return Command("document_get_by_query", data);
}

std::vector<std::string> Client::Ids(const std::string& query) const {
    const Json::Value reply = Query(query);
    if (!reply["success"].asBool()) {
        return {"error " + std::to_string(reply["error"]["code"].asInt())};
    }
    std::vector<std::string> ids;
    for (const Json::Value& hit : reply["data"]) {
        ids.push_back(hit["path"].asString());
    }
    return ids;
}

const Json::Value& TestMappings() {
    static const Json::Value mappings = ParseJson(R"({
        "property_id": "path",
        "default": {"type": "string", "analyzer": "kestostandard", "required": false,
                    "stored": true, "_all": true},
        "properties": {
            "path": {"analyzer": "keyword", "required": true, "_all": false},
            "parent": {"analyzer": "keyword", "_all": false},
            "size": {"type": "int"},
            "length": {"type": "double"},
            "dir": {"type": "bool", "_all": false},
            "title": {"type": "text"},
            "authors": {"type": "text", "analyzer": "white space"},
            "name": {"type": "text", "analyzer": "white space", "preprocess": ["tolower", "ngram"]},
            "secret": {"stored": false},
            "private": {"_all": false},
            "KESTOMDTextContent": {"type": "text"}}})");
    return mappings;
}

}  // namespace elasticd
