#pragma once

#include <map>
#include <mutex>
#include <stdexcept>
#include <string>
#include <vector>

#include "programs/fileindexd/index.h"

namespace fileindexd {

/// The worker is killed.
struct Killed {};

/// An index in memory that keeps the search daemon's rules: single documents are found in the
/// pending batch, lists show what was committed. Every call can be the one that ends the process.
class FakeIndex : public Index {
  public:
    struct Content {
        Attributes attributes;
        std::string text;   ///< of a file whose metadata was wanted
        std::string error;  ///< why there is none
        bool error_can_pass = false;
        /// The times of a directory change without an event.
        bool operator==(const Content& other) const {
            return text == other.text && attributes.is_dir == other.attributes.is_dir &&
                   (attributes.is_dir || attributes.modified == other.attributes.modified);
        }
    };
    using Documents = std::map<std::string, Content>;

    void Upsert(const std::string& path, bool need_meta) override;
    bool SetAttributes(const std::string& path) override;
    bool Rename(const std::string& to, const std::string& from) override;
    void Delete(const std::string& path) override;
    void DeleteBelow(const std::string& directory) override;
    void Commit() override;
    std::vector<Document> ListBelow(const std::string& directory, const std::string& after,
                                    std::size_t limit) override;
    std::vector<Document> Find(const std::vector<std::string>& paths) override;

    /// The next call number `count` (from 1) is not carried out; 0: none is.
    void KillAt(int count) { kill_in_ = count; }
    /// The search daemon dies, too: what was not committed is gone.
    void LoseBatch() { pending_ = committed_; }

    const Documents& Committed() const { return committed_; }
    int extracted = 0;  ///< files sent with their content
    /// Files whose content cannot be read, and whether that can pass.
    std::map<std::string, bool> unreadable;

  private:
    void Call();

    Documents committed_;
    Documents pending_;
    std::mutex mutex_;  ///< held by Upsert, which comes from several threads
    int kill_in_ = 0;
};

/// The document that a fresh extraction of the path gives. Throws DocumentError.
FakeIndex::Content Extract(const std::string& path, bool need_meta);

}  // namespace fileindexd
