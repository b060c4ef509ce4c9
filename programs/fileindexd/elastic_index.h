#pragma once

#include <json/json.h>

#include <cstddef>
#include <string>
#include <vector>

#include "programs/fileindexd/index.h"

namespace fileindexd {

/// A share's index in the search daemon.
class ElasticIndex : public Index {
  public:
    explicit ElasticIndex(std::string share) : share_(std::move(share)) {}

    void Upsert(const std::string& path, bool need_meta) override;
    bool SetAttributes(const std::string& path) override;
    bool Rename(const std::string& to, const std::string& from) override;
    void Delete(const std::string& path) override;
    void DeleteBelow(const std::string& directory) override;
    /// Also throws Error 913 when the daemon was restarted since the first change of the batch:
    /// what it had not committed is gone.
    void Commit() override;
    std::vector<Document> ListBelow(const std::string& directory, std::size_t offset,
                                    std::size_t limit) override;
    std::vector<Document> Find(const std::vector<std::string>& paths) override;

  private:
    void NoteChange();
    std::vector<Document> Query(const Json::Value& qsl, std::size_t offset, std::size_t limit);

    std::string share_;
    std::string daemon_;  ///< the daemon that took the batch's first change; empty: no change yet
};

}  // namespace fileindexd
