#include "programs/kestoelasticd/engine/sqlite/writer.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "base/path.h"
#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/engine.h"

namespace elasticd::engine::sqlite {
namespace {

using ::sqlite::ResetAtEnd;
using ::sqlite::Statement;

/// Where a node is while it moves; no node has this number.
constexpr std::int64_t kLimbo = -1;
constexpr std::size_t kMaxId = 64 * 1024;

std::string NameOf(std::string_view id) {
    return std::string(id.substr(id.rfind('/') + 1));
}

std::int64_t RoundedLength(std::uint8_t length) {
    return std::llround(Lengths::Decode(length));
}

void Apply(Record& record, unsigned int number, const Value& value) {
    const auto held = std::find_if(record.begin(), record.end(),
                                   [&](const auto& entry) { return entry.first == number; });
    if (IsNone(value)) {
        if (held != record.end()) {
            record.erase(held);
        }
    } else if (held != record.end()) {
        held->second = value;
    } else {
        record.emplace_back(number, value);
    }
}

}  // namespace

Documents::Documents(::sqlite::Database& database, Tree& tree, const FieldTable& fields)
    : tree_(tree),
      fields_(fields),
      record_(database, "SELECT fields FROM records WHERE id=?"),
      text_(database, "SELECT body FROM texts WHERE id=?") {}

Record Documents::ReadRecord(std::int64_t id, std::string_view name) {
    ResetAtEnd reset(record_);
    if (!record_.Bind(1, id).Step()) {
        throw Damaged("the index lacks the record of document " + std::to_string(id));
    }
    return DecodeRecord(record_.Bytes(0), name);
}

Value Documents::ReadText(std::int64_t id) {
    ResetAtEnd reset(text_);
    if (!text_.Bind(1, id).Step()) {
        return {};
    }
    Record only = DecodeRecord(UnpackText(text_.Bytes(0)), {});
    if (only.size() != 1) {
        throw Damaged("the text of document " + std::to_string(id) + " is damaged");
    }
    return std::move(only.front().second);
}

Writer::Writer(::sqlite::Database& database, const Schema& schema, Lengths& lengths)
    : database_(database),
      fields_(schema),
      tree_(database),
      documents_(database, tree_, fields_),
      lengths_(lengths),
      words_(database),
      insert_record_(database, "INSERT OR REPLACE INTO records VALUES(?, ?)"),
      insert_text_(database, "INSERT OR REPLACE INTO texts VALUES(?, ?)") {
    fields_.Load(database);
}

void Writer::Begin() {
    if (!transaction_) {
        transaction_.emplace(database_);
        document_count_ = ReadMeta(database_, kDocuments);
        total_length_ = ReadMeta(database_, kTotalLength);
    }
}

/// The text goes apart; what stands for no value, for the id or for its directory goes nowhere.
Record Writer::MakeRecord(const std::vector<Field>& fields, Value& text) {
    Record record;
    for (const Field& field : fields) {
        if (field.name == kTextField) {
            fields_.FindOrAdd(field.name);
            text = field.value;
        } else if (!IsNone(field.value) && field.name != fields_.GetSchema().IdField()) {
            const unsigned int number = fields_.FindOrAdd(field.name);
            record.emplace_back(number, field.name == kParentField ? Value(true) : field.value);
        }
    }
    return record;
}

void Writer::Upsert(const Document& document) {
    if (document.id.size() > kMaxId) {
        throw quivra::Error(kBadDocument, "The document's id is too long");
    }
    Value text;
    Record record = MakeRecord(document.fields, text);
    const Encoded encoded = Encode(std::move(record), std::move(text), fields_);
    Begin();
    const std::string name = NameOf(document.id);
    const Node node = tree_.PlaceDocument(document.id);
    if (node.has_document) {
        Remove(node.id, name);
    }
    Store(node.id, name, encoded);
    words_.Insert(node.id, encoded.columns);
}

/// Everything of a new document but its words.
void Writer::Store(std::int64_t id, std::string_view name, const Encoded& encoded) {
    fields_.Save(database_);
    StoreTyped(id, encoded);
    const std::string record = EncodeRecord(encoded.record, name);
    insert_record_.Bind(1, id).BindBlob(2, record).Run();
    StoreText(id, encoded.text);
    CountLength(id, encoded.length);
    ++document_count_;
}

void Writer::StoreTyped(std::int64_t id, const Encoded& encoded) {
    const std::vector<unsigned int>& columns = fields_.Typed();
    if (typed_count_ != columns.size()) {
        std::string names = "INSERT OR REPLACE INTO docs(id";
        std::string values = ") VALUES(?1";
        for (std::size_t i = 0; i < columns.size(); ++i) {
            names += "," + TypedColumn(columns[i]);
            values += ",?" + std::to_string(i + 2);
        }
        insert_typed_.emplace(database_, names + values + ")");
        typed_count_ = columns.size();
    }
    insert_typed_->Bind(1, id);
    for (std::size_t i = 0; i < columns.size(); ++i) {
        const int parameter = static_cast<int>(i) + 2;
        const auto held =
            std::find_if(encoded.typed.begin(), encoded.typed.end(),
                         [&](const auto& typed) { return typed.first == columns[i]; });
        if (held == encoded.typed.end()) {
            insert_typed_->BindNull(parameter);
        } else if (const auto* whole = std::get_if<std::int64_t>(&held->second)) {
            insert_typed_->Bind(parameter, *whole);
        } else if (const auto* real = std::get_if<double>(&held->second)) {
            insert_typed_->Bind(parameter, *real);
        } else {
            insert_typed_->BindBlob(parameter, std::get<std::string>(held->second));
        }
    }
    insert_typed_->Run();
}

void Writer::StoreText(std::int64_t id, const Value& text) {
    if (!IsNone(text)) {
        const std::string packed = PackText(EncodeRecord({{0, text}}, {}));
        insert_text_.Bind(1, id).BindBlob(2, packed).Run();
    }
}

void Writer::CountLength(std::int64_t id, std::size_t length) {
    const std::uint8_t kept = Lengths::Encode(length);
    total_length_ += RoundedLength(kept);
    lengths_.Put(id, kept);
}

void Writer::ForgetLength(std::int64_t id) {
    total_length_ -= RoundedLength(lengths_.Of(id));
    lengths_.Put(id, 0);
}

/// Everything of a document but its node.
void Writer::Remove(std::int64_t id, std::string_view name) {
    Encoded old = Encode(documents_.ReadRecord(id, name), documents_.ReadText(id), fields_);
    words_.Remove(id, std::move(old.columns));
    for (const char* table : {"docs", "records", "texts"}) {
        Statement(database_, std::string("DELETE FROM ") + table + " WHERE id=?").Bind(1, id).Run();
    }
    ForgetLength(id);
    --document_count_;
}

void Writer::Delete(const std::string& id) {
    const std::optional<Node> node = tree_.Find(id);
    if (node && node->has_document) {
        Begin();
        Remove(node->id, NameOf(id));
        tree_.SetHasDocument(node->id, false);
        tree_.RemoveEmpty(node->id);
    }
}

void Writer::DeleteAll(const Bitmap& ids) {
    Begin();
    ids.ForEach([&](std::int64_t id) {
        Remove(id, tree_.PositionOf(id).second);
        tree_.SetHasDocument(id, false);
        tree_.RemoveEmpty(id);
    });
}

void Writer::Set(const std::string& id, const std::string& new_id,
                 const std::vector<Field>& changes) {
    const std::optional<Node> node = tree_.Find(id);
    if (!node || !node->has_document) {
        throw quivra::Error(kNoSuchDocument, "No such document: " + id);
    }
    if (new_id.size() > kMaxId) {
        throw quivra::Error(kBadDocument, "The document's id is too long");
    }
    if (new_id != id && new_id.starts_with(id + "/")) {
        MoveAlone(*node, id, new_id, changes);
        return;
    }
    Rewrite(node->id, NameOf(id), NameOf(new_id), changes);
    if (new_id != id) {
        MoveTree(*node, new_id);
    }
}

/// Changes a document where it is. Its text is read, and its words made again, only where other
/// words than keywords and numbers change: those share no column with the rest, and so can be
/// exchanged alone (in one column, FTS5 takes a word out of all columns of the document).
void Writer::Rewrite(std::int64_t id, std::string_view old_name, std::string_view new_name,
                     const std::vector<Field>& changes) {
    Record old_record = documents_.ReadRecord(id, old_name);
    Record new_record = old_record;
    bool new_text = false;
    Value text;
    for (const Field& field : changes) {
        if (field.name == kTextField) {
            new_text = true;
            text = field.value;
        }
        const unsigned int number = fields_.FindOrAdd(field.name);
        if (field.name != kTextField && field.name != fields_.GetSchema().IdField()) {
            const bool parent = field.name == kParentField && !IsNone(field.value);
            Apply(new_record, number, parent ? Value(true) : field.value);
        }
    }
    Encoded old = Encode(std::move(old_record), {}, fields_);
    Encoded changed = Encode(std::move(new_record), {}, fields_);
    bool only_tokens = !new_text;
    for (std::size_t column = 0; column < kColumns; ++column) {
        only_tokens &= column == kTokenColumn ||
                       old.columns[column].Bytes() == changed.columns[column].Bytes();
    }
    Columns removed;
    Columns inserted;
    if (only_tokens) {
        removed[kTokenColumn] = std::move(old.columns[kTokenColumn]);
        inserted[kTokenColumn] = std::move(changed.columns[kTokenColumn]);
    } else {
        Value old_text = documents_.ReadText(id);
        old = Encode(std::move(old.record), old_text, fields_);
        changed = Encode(std::move(changed.record), new_text ? text : std::move(old_text), fields_);
        removed = std::move(old.columns);
        inserted = std::move(changed.columns);
    }
    Begin();
    fields_.Save(database_);
    StoreTyped(id, changed);
    const std::string record = EncodeRecord(changed.record, new_name);
    insert_record_.Bind(1, id).BindBlob(2, record).Run();
    if (new_text) {
        Statement(database_, "DELETE FROM texts WHERE id=?").Bind(1, id).Run();
        StoreText(id, changed.text);
    }
    if (!only_tokens) {
        ForgetLength(id);
        CountLength(id, changed.length);
    }
    words_.Remove(id, std::move(removed));
    words_.Insert(id, std::move(inserted));
}

/// The node moves with everything below it: one row, however much that is. What is at the new place
/// and not at the old one stays.
void Writer::MoveTree(const Node& node, const std::string& new_id) {
    const std::int64_t old_parent = tree_.PositionOf(node.id).first;
    // Out of the way first: the new place may be above the old one.
    tree_.MoveTo(node.id, kLimbo, {});
    if (const std::optional<Node> target = tree_.Find(new_id)) {
        const Tree::Position place = tree_.PositionOf(target->id);
        Merge(node, *target, place.first, place.second);
    } else {
        tree_.Move(node.id, new_id);
    }
    tree_.RemoveEmpty(old_parent);
}

/// Makes one node of two, at the given place. The source's documents take the place of the
/// target's.
void Writer::Merge(const Node& source, const Node& target, std::int64_t parent,
                   const std::string& name) {
    const bool keep_target = target.has_document && !source.has_document;
    const Node& kept = keep_target ? target : source;
    const Node& lost = keep_target ? source : target;
    if (lost.has_document) {
        Remove(lost.id, name);
    }
    std::vector<std::pair<std::string, Node>> children;
    tree_.ForEachChild(lost.id, {}, [&](std::string_view child, const Node& node) {
        children.emplace_back(child, node);
        return true;
    });
    for (const auto& [child_name, child] : children) {
        const std::optional<Node> other = tree_.FindChild(kept.id, child_name);
        if (!other) {
            tree_.MoveTo(child.id, kept.id, child_name);
        } else if (keep_target) {
            Merge(child, *other, kept.id, child_name);
        } else {
            Merge(*other, child, kept.id, child_name);
        }
    }
    Statement(database_, "DELETE FROM nodes WHERE id=?").Bind(1, lost.id).Run();
    tree_.MoveTo(kept.id, parent, name);
}

/// A path that moves below itself: no file system does that, but a damaged queue may ask for it.
/// The document goes alone.
void Writer::MoveAlone(const Node& node, const std::string& id, const std::string& new_id,
                       const std::vector<Field>& changes) {
    Rewrite(node.id, NameOf(id), NameOf(id), changes);
    const Encoded encoded =
        Encode(documents_.ReadRecord(node.id, NameOf(id)), documents_.ReadText(node.id), fields_);
    const Node place = tree_.PlaceDocument(new_id);
    if (place.has_document) {
        Remove(place.id, NameOf(new_id));
    }
    Remove(node.id, NameOf(id));
    tree_.SetHasDocument(node.id, false);
    Store(place.id, NameOf(new_id), encoded);
    words_.Insert(place.id, encoded.columns);
}

void Writer::Commit() {
    if (!wanted_indexes_.empty()) {
        Begin();
    }
    if (!transaction_) {
        return;
    }
    words_.Flush();
    fields_.Save(database_);
    for (const unsigned int field : std::exchange(wanted_indexes_, {})) {
        const std::string column = TypedColumn(field);
        database_.Execute("CREATE INDEX IF NOT EXISTS docs_by_" + column + " ON docs(" + column +
                          ") WHERE " + column + " IS NOT NULL");
    }
    lengths_.Save(database_);
    WriteMeta(database_, kDocuments, document_count_);
    WriteMeta(database_, kTotalLength, total_length_);
    WriteMeta(database_, kGeneration, ReadMeta(database_, kGeneration) + 1);
    transaction_->Commit();
    transaction_.reset();
    lengths_.Publish();
}

void Writer::Rollback() noexcept {
    try {
        transaction_.reset();
        words_.Drop();
        lengths_.Drop();
        tree_.Forget();
        fields_.Reset();
        typed_count_ = SIZE_MAX;
        insert_typed_.reset();
        fields_.Load(database_);
    } catch (...) {  // a damaged or vanished file; the next call meets it again
    }
}

}  // namespace elasticd::engine::sqlite
