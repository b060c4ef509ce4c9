#pragma once

#include <json/json.h>
#include <xapian.h>

#include <memory>
#include <string>
#include <vector>

#include "programs/kestoelasticd/mapping.h"
#include "programs/kestoelasticd/record.h"
#include "programs/kestoelasticd/terms.h"

namespace elasticd {

class DocumentEditor;

/// The changing side of one index: gathers changes in a batch that readers do not see, and that is
/// durable and visible as a whole after Commit. Used by one thread at a time.
///
/// What is refused (Error 1408, 1409) leaves the batch as it was. When the engine itself fails, the
/// batch is gone: the error says so, and so does the next Commit (1411), after which all is well
/// again.
class IndexWriter {
  public:
    /// Opens nothing yet. `database` is the path of a Xapian database.
    IndexWriter(std::string database, std::shared_ptr<const Mapping> mapping);
    /// Drops the batch.
    ~IndexWriter();
    IndexWriter(const IndexWriter&) = delete;
    IndexWriter& operator=(const IndexWriter&) = delete;

    /// Makes an empty database; its directory does not exist.
    static void Create(const std::string& database, const Mapping& mapping);

    /// Replaces or creates the document. Throws Error 1409 when `data` does not follow the mapping.
    void Upsert(const std::string& id, const Json::Value& data);
    /// Changes the given fields of the document and no others; null removes one. When the field
    /// that identifies the document changes, the document takes the place of the one that has the
    /// new id. Throws Error 1408 when there is no such document, 1409 as Upsert.
    void Set(const std::string& id, const Json::Value& changes);
    /// Also succeeds when there is no such document.
    void Delete(const std::string& id);
    /// Deletes what the query matches, uncommitted documents included.
    void DeleteByQuery(const Json::Value& qsl);

    /// Throws Error 1411 (earlier changes were lost), 1412 (no space) or 1415; then nothing of the
    /// batch has been committed, and the next batch starts empty.
    void Commit();
    /// Drops the batch and closes the files.
    void Close() noexcept;
    /// Makes the next Commit fail, for changes that were lost elsewhere.
    void SetBatchLost() { batch_lost_ = true; }
    bool IsBatchLost() const { return batch_lost_; }
    bool HasChanges() const { return has_changes_; }

  private:
    template <typename Action>
    auto Guarded(const Action& action);
    Xapian::WritableDatabase& Open();
    void BeginChange();
    Xapian::docid Find(const std::string& id);
    void CheckRequired(const Json::Value& data) const;
    void Remove(Xapian::docid document);
    void SaveFields();
    void PutText(Xapian::docid document, const Json::Value& text, bool is_new);
    void CountTowardsFlush(Xapian::docid document, std::size_t bytes);
    void ApplyChange(DocumentEditor& editor, Record& record, const std::string& field,
                     const Json::Value& change, Xapian::docid document);

    const std::string path_;
    const std::shared_ptr<const Mapping> mapping_;
    std::unique_ptr<Xapian::WritableDatabase> database_;
    FieldTable fields_;
    std::size_t saved_fields_ = 0;  ///< how many of fields_ are in the database
    std::size_t bytes_pending_ = 0;
    bool has_changes_ = false;
    bool batch_lost_ = false;
};

/// The metadata keys of a database; they are on disk.
inline constexpr char kFieldTableKey[] = "fields";
std::string TextKey(Xapian::docid document);

}  // namespace elasticd
