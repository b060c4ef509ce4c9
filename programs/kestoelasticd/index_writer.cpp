#include "programs/kestoelasticd/index_writer.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "base/unique_fd.h"
#include "common/error.h"
#include "common/json.h"
#include "common/log.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/document_editor.h"
#include "programs/kestoelasticd/engine_error.h"
#include "programs/kestoelasticd/query.h"

namespace elasticd {
namespace {

using quivra::Error;

/// Every so many bytes of text count as one more change towards the engine's flush threshold.
constexpr std::size_t kBytesPerChange = 8 * 1024;
constexpr std::size_t kMaxDocumentText = 64 << 20;

/// The engine syncs its files, not the directory that names them.
void SyncDirectory(const std::string& path) {
    const quivra::base::UniqueFd fd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!fd.IsValid() || fsync(fd.Get()) != 0) {
        quivra::LogError({"index_writer", __LINE__}, "cannot sync %s", path.c_str());
    }
}

}  // namespace

std::string TextKey(Xapian::docid document) {
    // Big-endian, so that the texts of neighbours lie side by side.
    std::string key = "t";
    for (int shift = 24; shift >= 0; shift -= 8) {
        key += static_cast<char>(document >> shift);
    }
    return key;
}

IndexWriter::IndexWriter(std::string database, std::shared_ptr<const Mapping> mapping)
    : path_(std::move(database)), mapping_(std::move(mapping)) {}

IndexWriter::~IndexWriter() {
    Close();
}

void IndexWriter::Create(const std::string& database, const Mapping& mapping) {
    TranslateEngineErrors([&] {
        FieldTable fields;
        for (const auto& [name, settings] : mapping.Listed()) {
            fields.FindOrAdd(name);
        }
        Xapian::WritableDatabase created(database, Xapian::DB_CREATE | Xapian::DB_BACKEND_GLASS);
        created.set_metadata(kFieldTableKey, fields.Save());
        created.commit();
    });
    SyncDirectory(database);
}

/// Runs what changes the batch. Errors of our own are thrown before anything is written; any other
/// leaves a batch of unknown content, which is dropped.
template <typename Action>
auto IndexWriter::Guarded(const Action& action) {
    try {
        return TranslateEngineErrors(action);
    } catch (const Error& error) {
        if (IsEngineError(error.code)) {
            Close();
            batch_lost_ = true;
        }
        throw;
    }
}

Xapian::WritableDatabase& IndexWriter::Open() {
    if (!database_) {
        auto opened = std::make_unique<Xapian::WritableDatabase>(path_, Xapian::DB_OPEN);
        fields_.Load(opened->get_metadata(kFieldTableKey));
        saved_fields_ = fields_.Size();
        database_ = std::move(opened);
    }
    return *database_;
}

/// Everything happens within a transaction: outside of one, the engine commits by itself.
void IndexWriter::BeginChange() {
    if (!has_changes_) {
        Open().begin_transaction();
        has_changes_ = true;
    }
}

Xapian::docid IndexWriter::Find(const std::string& id) {
    const std::string term = IdTerm(id);
    const Xapian::PostingIterator found = Open().postlist_begin(term);
    return found == Open().postlist_end(term) ? 0 : *found;
}

void IndexWriter::CheckRequired(const Json::Value& data) const {
    for (const std::string& field : mapping_->RequiredFields()) {
        if (!data.isMember(field) || data[field].isNull()) {
            throw Error(kBadDocument, "A required field is missing: " + field);
        }
    }
}

void IndexWriter::Upsert(const std::string& id, const Json::Value& data) {
    CheckRequired(data);
    if (const Json::Value& own = data[mapping_->IdField()]; !own.isNull() && own != id) {
        throw Error(kBadDocument, "The document names another id: " + mapping_->IdField());
    }
    Guarded([&] {
        Open();
        Xapian::Document document;
        DocumentEditor editor(*mapping_, fields_, document);
        editor.AddId(id);
        Record record;
        std::size_t bytes = 0;
        for (auto it = data.begin(); it != data.end(); ++it) {
            const std::string name = it.name();
            if (name == mapping_->IdField() || it->isNull()) {
                continue;
            }
            std::string json;
            AppendJson(json, *it);
            bytes += json.size();
            if (bytes > kMaxDocumentText) {
                throw Error(kBadDocument, "The document is too large");
            }
            editor.AddField(name, *it);
            if (name != kTextField) {
                record[fields_.FindOrAdd(name)] = std::move(json);
            }
        }
        editor.Finish();
        document.set_data(EncodeRecord(record));

        const Xapian::docid found = Find(id);
        BeginChange();
        SaveFields();
        Xapian::docid number = found;
        if (found != 0) {
            database_->replace_document(found, document);
        } else {
            number = database_->add_document(document);
        }
        PutText(number, data[kTextField], found == 0);
        CountTowardsFlush(number, bytes);
    });
}

void IndexWriter::Set(const std::string& id, const Json::Value& changes) {
    const Json::Value& id_change = changes[mapping_->IdField()];
    if (changes.isMember(mapping_->IdField()) &&
        (!id_change.isString() || id_change.asString().empty())) {
        throw Error(kBadDocument, "A document cannot lose its id");
    }
    const std::string new_id = id_change.isString() ? id_change.asString() : id;
    for (const std::string& field : mapping_->RequiredFields()) {
        if (changes.isMember(field) && changes[field].isNull()) {
            throw Error(kBadDocument, "A required field cannot be removed: " + field);
        }
    }
    Guarded([&] {
        const Xapian::docid found = Find(id);
        if (found == 0) {
            throw Error(kNoSuchDocument, "No such document: " + id);
        }
        Xapian::Document document = database_->get_document(found);
        DocumentEditor editor(*mapping_, fields_, document);
        Record record = DecodeRecord(document.get_data());
        for (auto it = changes.begin(); it != changes.end(); ++it) {
            if (it.name() != mapping_->IdField()) {
                ApplyChange(editor, record, it.name(), *it, found);
            }
        }
        editor.Finish();
        document.set_data(EncodeRecord(record));
        const Xapian::docid in_the_way = new_id == id ? 0 : Find(new_id);
        if (new_id != id) {
            editor.ReplaceId(id, new_id);
        }
        BeginChange();
        SaveFields();
        if (in_the_way != 0) {
            Remove(in_the_way);
        }
        database_->replace_document(found, document);
        if (changes.isMember(kTextField)) {
            PutText(found, changes[kTextField], false);
        }
    });
}

/// Changes one field of the document and of its record, when it changes at all.
void IndexWriter::ApplyChange(DocumentEditor& editor, Record& record, const std::string& field,
                              const Json::Value& change, Xapian::docid document) {
    const unsigned int number = fields_.FindOrAdd(field);
    std::string text;
    if (!change.isNull()) {
        AppendJson(text, change);
    }
    const bool is_text = field == kTextField;
    const auto held = record.find(number);
    std::string old_text = held == record.end() ? std::string() : held->second;
    if (is_text) {
        old_text = UnpackText(database_->get_metadata(TextKey(document)));
    }
    if (old_text == text) {
        return;
    }
    if (!old_text.empty()) {
        Json::Value old_value;
        quivra::fromString(old_value, old_text);
        editor.RemoveField(field, old_value);
    }
    editor.AddField(field, change);
    if (is_text) {
        return;
    }
    if (change.isNull()) {
        record.erase(number);
    } else {
        record[number] = text;
    }
}

void IndexWriter::Delete(const std::string& id) {
    Guarded([&] {
        if (const Xapian::docid found = Find(id); found != 0) {
            BeginChange();
            Remove(found);
        }
    });
}

void IndexWriter::DeleteByQuery(const Json::Value& qsl) {
    Guarded([&] {
        Open();
        const ParsedQuery parsed = ParseQuery(qsl, *mapping_, fields_);
        std::vector<Xapian::docid> found;
        Xapian::Enquire enquire(*database_);
        enquire.set_query(parsed.query);
        enquire.set_docid_order(Xapian::Enquire::DONT_CARE);
        const Xapian::MSet hits = enquire.get_mset(0, database_->get_doccount());
        for (Xapian::MSetIterator hit = hits.begin(); hit != hits.end(); ++hit) {
            found.push_back(*hit);
        }
        for (const Xapian::docid document : found) {
            BeginChange();
            Remove(document);
        }
    });
}

void IndexWriter::Remove(Xapian::docid document) {
    database_->delete_document(document);
    database_->set_metadata(TextKey(document), std::string());
}

/// Keeps the field table in step with the documents that use it.
void IndexWriter::SaveFields() {
    if (saved_fields_ != fields_.Size()) {
        database_->set_metadata(kFieldTableKey, fields_.Save());
        saved_fields_ = fields_.Size();
    }
}

void IndexWriter::PutText(Xapian::docid document, const Json::Value& text, bool is_new) {
    std::string packed;
    if (!text.isNull()) {
        std::string json;
        AppendJson(json, text);
        packed = PackText(json);
    }
    if (!packed.empty() || !is_new) {
        database_->set_metadata(TextKey(document), packed);
    }
}

/// The engine writes its buffers out (without committing) after a number of changes, however large
/// they are. Large documents count for more than one, by touching themselves.
void IndexWriter::CountTowardsFlush(Xapian::docid document, std::size_t bytes) {
    bytes_pending_ += bytes;
    for (; bytes_pending_ >= kBytesPerChange; bytes_pending_ -= kBytesPerChange) {
        Xapian::Document same = database_->get_document(document);
        same.set_data(same.get_data());
        database_->replace_document(document, same);
    }
}

void IndexWriter::Commit() {
    if (std::exchange(batch_lost_, false)) {
        Close();
        throw Error(kBatchLost, "Changes since the last commit were lost; repeat them");
    }
    if (!has_changes_) {
        return;
    }
    try {
        TranslateEngineErrors([&] { database_->commit_transaction(); });
    } catch (const Error&) {
        Close();
        throw;
    }
    has_changes_ = false;
    SyncDirectory(path_);
}

void IndexWriter::Close() noexcept {
    try {
        if (database_ && has_changes_) {
            database_->cancel_transaction();
        }
    } catch (...) {  // a handle that failed; what matters is that it goes
    }
    has_changes_ = false;
    bytes_pending_ = 0;
    try {
        database_.reset();
    } catch (...) {
    }
}

}  // namespace elasticd
