#include "programs/kestoelasticd/engine/sqlite/encoder.h"

#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/engine.h"
#include "programs/kestoelasticd/engine/words.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr std::size_t kMaxGramText = 64 * 1024;

class DocumentEncoder {
  public:
    explicit DocumentEncoder(Encoded& out) : out_(out) {}

    void Add(unsigned int number, const FieldTable::Entry& field, const Value& value) {
        if (field.settings->IsNumeric()) {
            AddNumber(number, field, value);
        } else if (field.settings->ngram) {
            AddGrams(number, field, value);
        } else {
            ForEachText(value, [&](std::string_view text) { AddText(number, field, text); });
        }
    }

  private:
    ColumnText& Column(int column) { return out_.columns[static_cast<std::size_t>(column)]; }

    void AddNumber(unsigned int number, const FieldTable::Entry& field, const Value& value) {
        const std::optional<Value> typed = ToNumber(field.settings->type, value);
        if (!typed) {
            throw quivra::Error(kBadDocument,
                                "The value does not fit the field's type: " + field.name);
        }
        if (field.settings->in_all && field.settings->type != FieldType::kBool) {
            Column(kTokenColumn).AddToken(NumberToken(*typed));
        }
        out_.typed.emplace_back(number, *typed);
    }

    void AddGrams(unsigned int number, const FieldTable::Entry& field, const Value& value) {
        std::string folded = FoldedText(value);
        if (folded.size() > kMaxGramText) {
            throw quivra::Error(kBadDocument, "Too long for n-grams: " + field.name);
        }
        if (field.IsScoped()) {
            Column(field.column).AddScopedGrams(number, folded);
        } else {
            Column(field.column).AddGrams(folded);
        }
        out_.length += folded.size();
        out_.typed.emplace_back(number, std::move(folded));
    }

    void AddText(unsigned int number, const FieldTable::Entry& field, std::string_view text) {
        const FieldSettings& settings = *field.settings;
        if (settings.IsKeyword()) {
            Column(kTokenColumn)
                .AddToken(settings.fold ? KeywordToken(number, Fold(text))
                                        : KeywordToken(number, text));
            if (settings.in_all) {
                Column(kSharedColumn).AddWords(text);
            }
            return;
        }
        if (field.IsScoped()) {
            Column(field.column).AddScopedWords(number, settings.in_all, text);
        } else {
            Column(field.column).AddWords(text);
        }
        out_.length += text.size();
    }

    Encoded& out_;
};

}  // namespace

Encoded Encode(Record record, Value text, const FieldTable& fields) {
    Encoded encoded;
    encoded.record = std::move(record);
    encoded.text = std::move(text);
    DocumentEncoder encoder(encoded);
    for (const auto& [number, value] : encoded.record) {
        if (const FieldTable::Entry& field = fields.Of(number); field.searched) {
            encoder.Add(number, field, value);
        }
    }
    if (const auto number = fields.Find(kTextField); number && !IsNone(encoded.text)) {
        encoder.Add(*number, fields.Of(*number), encoded.text);
    }
    return encoded;
}

std::string FoldedText(const Value& value) {
    std::string folded;
    ForEachText(value, [&](std::string_view text) {
        folded += folded.empty() ? "" : "\n";
        folded += Fold(text);
    });
    return folded;
}

}  // namespace elasticd::engine::sqlite
