#include "programs/kestoelasticd/engine/sqlite/ranking.h"

#include <sqlite3.h>

#include <algorithm>
#include <array>
#include <cmath>

#include "programs/kestoelasticd/engine/sqlite/fts.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr unsigned int kVisitsBetweenChecks = 1024;
/// BM25's usual constants: how soon more of a word counts no more, how much length counts.
constexpr double kSaturation = 1.2;
constexpr double kLengthShare = 0.75;
/// A hit in a name weighs as much as many in a text; one in a title or another short field, some.
constexpr float kGramWeight = 8;
constexpr float kFieldWeight = 2;

std::array<float, kColumns> WeightsOf(const FieldTable& fields) {
    std::array<float, kColumns> weights;
    weights.fill(kFieldWeight);
    weights[kTextColumn] = 1;
    for (unsigned int number = 0; number < fields.Size(); ++number) {
        if (const FieldTable::Entry& field = fields.Of(number); field.settings->ngram) {
            weights[static_cast<std::size_t>(field.column)] = kGramWeight;
        }
    }
    return weights;
}

class RankVisitor : public MatchVisitor {
  public:
    RankVisitor(::sqlite::Database& database, const FieldTable& fields,
                const Lengths::View& lengths, const Deadline& deadline, const RankRequest& request)
        : request_(request), weights_(WeightsOf(fields)), lengths_(lengths), deadline_(deadline) {
        documents_ = static_cast<double>(std::max<std::int64_t>(ReadMeta(database, kDocuments), 1));
        const double total = static_cast<double>(ReadMeta(database, kTotalLength));
        const double average = std::max(total / documents_, 1.0);
        for (std::size_t i = 0; i < norms_.size(); ++i) {
            const double length = Lengths::Decode(static_cast<std::uint8_t>(i));
            norms_[i] = static_cast<float>(kSaturation *
                                           (1 - kLengthShare + kLengthShare * length / average));
        }
    }

    bool Visit(const Fts5ExtensionApi& api, Fts5Context* context) override {
        if (rarities_.empty() && !FindRarities(api, context)) {
            return false;
        }
        const std::int64_t id = api.xRowid(context);
        if (request_.among != nullptr) {
            if (!request_.among->Has(id)) {
                return GoOn();
            }
            result_.visited.Set(id);
        }
        ++result_.matches;
        Offer({Score(api, context, norms_[lengths_.Of(id)]), id});
        return GoOn();
    }

    RankResult Finish() {
        std::sort(result_.best.begin(), result_.best.end());
        return std::move(result_);
    }

  private:
    bool GoOn() { return ++visits_ % kVisitsBetweenChecks != 0 || !deadline_.HasPassed(); }

    /// How rare each word is. One word alone needs none: a factor changes no order. Counting ends
    /// at a quarter of all documents; commoner words tell as little as that.
    bool FindRarities(const Fts5ExtensionApi& api, Fts5Context* context) {
        const int phrases = api.xPhraseCount(context);
        rarities_.assign(static_cast<std::size_t>(std::max(phrases, 1)), 1);
        for (int phrase = 0; phrase < phrases && phrases > 1; ++phrase) {
            count_ = 0;
            const int code = api.xQueryPhrase(
                context, phrase, this, [](const Fts5ExtensionApi*, Fts5Context*, void* self) {
                    auto* visitor = static_cast<RankVisitor*>(self);
                    const bool enough =
                        static_cast<double>(++visitor->count_) * 4 > visitor->documents_ + 4;
                    return enough || !visitor->GoOn() ? SQLITE_DONE : SQLITE_OK;
                });
            if (code != SQLITE_OK && code != SQLITE_DONE) {
                return false;
            }
            const double count = static_cast<double>(count_);
            rarities_[static_cast<std::size_t>(phrase)] = static_cast<float>(
                std::log(1 + (std::max(documents_ - count, 0.0) + 0.5) / (count + 0.5)));
        }
        return true;
    }

    float Score(const Fts5ExtensionApi& api, Fts5Context* context, float norm) const {
        float score = 0;
        for (std::size_t phrase = 0; phrase < rarities_.size(); ++phrase) {
            Fts5PhraseIter iterator;
            int column = 0;
            int offset = 0;
            float count = 0;
            if (api.xPhraseFirst(context, static_cast<int>(phrase), &iterator, &column, &offset) !=
                SQLITE_OK) {
                continue;
            }
            for (; column >= 0; api.xPhraseNext(context, &iterator, &column, &offset)) {
                count += weights_[static_cast<std::size_t>(column) % kColumns];
            }
            score += rarities_[phrase] * count / (count + norm);
        }
        return score;
    }

    /// Keeps the best in a heap, the worst of them on top.
    void Offer(const Ranked& ranked) {
        std::vector<Ranked>& best = result_.best;
        if (request_.wanted == 0 || (request_.after != nullptr && !(*request_.after < ranked))) {
            return;
        }
        if (best.size() < request_.wanted) {
            best.push_back(ranked);
            std::push_heap(best.begin(), best.end());
        } else if (ranked < best.front()) {
            std::pop_heap(best.begin(), best.end());
            best.back() = ranked;
            std::push_heap(best.begin(), best.end());
        }
    }

    const RankRequest& request_;
    const std::array<float, kColumns> weights_;
    const Lengths::View& lengths_;
    const Deadline& deadline_;
    double documents_ = 1;
    std::array<float, 256> norms_{};
    std::vector<float> rarities_;  ///< by number of phrase
    std::uint64_t count_ = 0;
    unsigned int visits_ = 0;
    RankResult result_;
};

}  // namespace

RankResult Rank(::sqlite::Database& database, const FieldTable& fields,
                const Lengths::View& lengths, const Deadline& deadline,
                const RankRequest& request) {
    if (request.words.empty()) {
        return {};
    }
    RankVisitor visitor(database, fields, lengths, deadline, request);
    VisitMatches(database, request.words, visitor);
    return visitor.Finish();
}

}  // namespace elasticd::engine::sqlite
