#pragma once

#include <json/json.h>

#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

/// Short ways to talk to the search daemon, in this process or through its socket.
namespace elasticd {

/// Turns a request text into the reply text.
using Transport = std::function<std::string(const std::string&)>;

/// Sends over a new connection to the socket; "" when the daemon does not answer.
std::string SendToSocket(const std::string& socket_path, const std::string& request);

Json::Value ParseJson(const std::string& text);

class Client {
  public:
    explicit Client(Transport transport) : transport_(std::move(transport)) {}

    /// The whole reply; null when there is none.
    Json::Value Ask(const Json::Value& request) const;
    Json::Value Command(const std::string& command,
                        const Json::Value& data = Json::objectValue) const;
    /// 0 for success, else the error's code; -1 when there is no reply.
    int Code(const std::string& command, const Json::Value& data = Json::objectValue) const;

    int Create(const std::string& path, const Json::Value& mappings) const;
    int Upsert(const std::string& id, const std::string& fields = "{}") const {
        return Document("document_upsert_by_id", id, fields);
    }
    int Set(const std::string& id, const std::string& fields) const {
        return Document("document_set_by_id", id, fields);
    }
    int Delete(const std::string& id) const { return Document("document_del_by_id", id, "{}"); }
    int Commit() const { return Code("commit"); }
    Json::Value Query(const std::string& query) const;
    /// The ids of the hits, in order; an error's code as "error 1410".
    std::vector<std::string> Ids(const std::string& query) const;
    /// The ids of everything.
    std::vector<std::string> All() const { return Ids(R"({"qsl": {"all": []}})"); }

    std::string index = "fileindex_s";

  private:
    int Document(const std::string& command, const std::string& id,
                 const std::string& fields) const;

    Transport transport_;
};

/// A mapping with every type, analyzer and flag.
const Json::Value& TestMappings();

using Ids = std::vector<std::string>;

}  // namespace elasticd
