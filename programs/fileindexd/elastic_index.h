#pragma once

#include <json/json.h>

#include <cstddef>
#include <mutex>
#include <string>
#include <vector>

#include "programs/fileindexd/index.h"

namespace fileindexd {

/// A share's index in the search daemon. Upsert may be called from several threads at once; the
/// other calls come from one at a time, and not while one of these runs.
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
    std::vector<Document> ListBelow(const std::string& directory, const std::string& after,
                                    std::size_t limit) override;
    std::vector<Document> Find(const std::vector<std::string>& paths) override;

    /// Whether the search daemon has made the index anew, so that it is empty and takes no changes
    /// until Accept. False where the daemon cannot be asked, or does not know the question.
    bool IsMadeAnew() const;
    /// Takes an index that was made anew into service. Throws what the other calls do.
    void Accept();

  private:
    /// Where the last page of a listing ended.
    struct Page {
        std::string directory;
        std::string last;
        std::size_t end = 0;
    };

    void NoteChange();
    std::size_t PositionBehind(const std::string& directory, const std::string& after);
    std::vector<Document> PageBelow(const std::string& directory, std::size_t offset,
                                    std::size_t limit);
    std::vector<Document> Query(const Json::Value& qsl, std::size_t offset, std::size_t limit);

    std::string share_;
    Page last_page_;
    std::mutex daemon_mutex_;  ///< guards daemon_
    std::string daemon_;  ///< the daemon that took the batch's first change; empty: no change yet
};

}  // namespace fileindexd
