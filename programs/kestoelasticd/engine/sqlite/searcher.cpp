#include "programs/kestoelasticd/engine/sqlite/searcher.h"

#include <algorithm>
#include <cstring>
#include <utility>

#include "programs/kestoelasticd/codes.h"
#include "programs/kestoelasticd/engine/sqlite/path_walk.h"
#include "programs/kestoelasticd/engine/sqlite/ranking.h"
#include "programs/kestoelasticd/engine/sqlite/sort_order.h"

namespace elasticd::engine::sqlite {
namespace {

using ::sqlite::Statement;

/// Up to so many matches are put in order in memory; more are met in order.
constexpr std::size_t kSortedInMemory = 50000;
/// From so many matches on, it pays to go through an index for the first ones.
constexpr std::size_t kFewForIndex = 1000;
constexpr unsigned int kStepsBetweenChecks = 1024;

[[noreturn]] void RefuseCursor() {
    throw quivra::Error(kBadQuery, "Bad query: \"after\" is not a cursor of this query");
}

std::string RankedCursor(const Ranked& ranked) {
    std::string cursor(sizeof(float) + sizeof(std::int64_t), '\0');
    std::memcpy(cursor.data(), &ranked.score, sizeof(float));
    std::memcpy(cursor.data() + sizeof(float), &ranked.id, sizeof(std::int64_t));
    return cursor;
}

Ranked ReadRankedCursor(const std::string& cursor) {
    Ranked ranked;
    if (cursor.size() != sizeof(float) + sizeof(std::int64_t)) {
        RefuseCursor();
    }
    std::memcpy(&ranked.score, cursor.data(), sizeof(float));
    std::memcpy(&ranked.id, cursor.data() + sizeof(float), sizeof(std::int64_t));
    return ranked;
}

}  // namespace

Searcher::Searcher(::sqlite::Database& database, Documents& documents, Lengths::View lengths,
                   const SearchRequest& request, const Take& take)
    : database_(database),
      documents_(documents),
      lengths_(std::move(lengths)),
      request_(request),
      take_(take),
      deadline_(database, request.deadline),
      matcher_(database, documents.GetTree(), deadline_),
      skip_(request.offset),
      left_(request.limit) {}

SearchResult Searcher::Run() {
    const Plan plan = MakePlan(request_.query, documents_.Fields(), documents_.GetTree());
    NoteTyped(plan);
    if (!request_.sort.empty()) {
        BySort(plan);
    } else if (request_.by_relevance) {
        ByRelevance(plan);
    } else {
        ById(plan);
    }
    return result_;
}

void Searcher::NoteTyped(const Plan& plan) {
    if (plan.kind == Plan::Kind::kTyped && !HasIndex(plan.field)) {
        wanted_.insert(plan.field);
    }
    for (const Plan& part : plan.parts) {
        NoteTyped(part);
    }
}

bool Searcher::HasIndex(unsigned int field) {
    Statement find(database_, "SELECT 1 FROM sqlite_schema WHERE type='index' AND name=?");
    const std::string name = "docs_by_" + TypedColumn(field);
    return find.BindText(1, name).Step();
}

/// Hits that have to be known: those on the page and those before it.
std::size_t Searcher::Wanted() const {
    return left_ == 0 ? 0 : left_ > SIZE_MAX - skip_ ? SIZE_MAX : skip_ + left_;
}

/// False when the page is full.
bool Searcher::Emit(std::int64_t id, std::string id_path, std::string cursor) {
    if (skip_ > 0) {
        --skip_;
        return true;
    }
    if (left_ == 0) {
        return false;
    }
    const std::size_t slash = id_path.rfind('/');
    const std::string_view name = std::string_view(id_path).substr(slash + 1);
    Hit hit;
    for (auto& [number, value] : documents_.ReadRecord(id, name)) {
        const FieldTable::Entry& field = documents_.Fields().Of(number);
        if (!field.settings->stored ||
            (request_.fields && !request_.fields->contains(field.name))) {
            continue;
        }
        const bool parent = field.name == kParentField;
        hit.fields.push_back({field.name, parent
                                              ? Value(slash == std::string::npos ? std::string(".")
                                                      : slash == 0               ? std::string("/")
                                                                   : id_path.substr(0, slash))
                                              : std::move(value)});
    }
    if (request_.with_text) {
        if (Value text = documents_.ReadText(id); !IsNone(text)) {
            hit.fields.push_back({kTextField, std::move(text)});
        }
    }
    hit.id = std::move(id_path);
    hit.cursor = std::move(cursor);
    take_(std::move(hit));
    deadline_.AllowForHit();
    --left_;
    return left_ > 0;
}

void Searcher::ByRelevance(const Plan& plan) {
    RankRequest rank;
    rank.words = WeightedWords(plan);
    rank.wanted = Wanted();
    Ranked after;
    if (!request_.after.empty()) {
        after = ReadRankedCursor(request_.after);
        rank.after = &after;
    }
    // What the full-text table answers alone needs one scan, not two.
    const bool alone = plan.kind == Plan::Kind::kWords && plan.weighted;
    Bitmap matches;
    if (!alone) {
        matches = matcher_.Match(plan);
        rank.among = &matches;
    }
    RankResult ranked = Rank(database_, documents_.Fields(), lengths_, deadline_, rank);
    result_.total = alone ? ranked.matches : matches.Count();
    if (!alone) {
        matches.Remove(ranked.visited);
        matches.ForEach([&](std::int64_t id) {
            const Ranked last{0, id};
            if (ranked.best.size() < rank.wanted && (rank.after == nullptr || after < last)) {
                ranked.best.push_back(last);
            }
        });
    }
    for (const Ranked& hit : ranked.best) {
        if (!Emit(hit.id, documents_.GetTree().PathOf(hit.id), RankedCursor(hit))) {
            break;
        }
    }
}

void Searcher::ById(const Plan& plan) {
    if (plan.kind == Plan::Kind::kEverything && !request_.with_batch) {
        result_.total = static_cast<std::uint64_t>(ReadMeta(database_, kDocuments));
        ByIdWalking(plan, nullptr);
        return;
    }
    const Bitmap matches = matcher_.Match(plan);
    result_.total = matches.Count();
    if (left_ == 0) {
        return;
    }
    if (result_.total > kSortedInMemory) {
        ByIdWalking(plan, &matches);
        return;
    }
    std::vector<Place> places;
    matches.ForEach([&](std::int64_t id) {
        Place place{documents_.GetTree().PathOf(id), id};
        if (place.key > request_.after || request_.after.empty()) {
            places.push_back(std::move(place));
        }
    });
    TakeSorted(std::move(places));
}

/// `matches`: none for everything.
void Searcher::ByIdWalking(const Plan& plan, const Bitmap* matches) {
    if (left_ == 0) {
        return;
    }
    // All that lies below one directory is found there.
    const bool within = plan.kind == Plan::Kind::kBelow && !plan.itself;
    const std::int64_t top = within ? plan.node : Tree::kRoot;
    unsigned int steps = 0;
    PathWalk walk(documents_.GetTree(), [&](const std::string& path, std::int64_t id) {
        if (++steps % kStepsBetweenChecks == 0) {
            deadline_.Check();
        }
        return (matches != nullptr && !matches->Has(id)) || Emit(id, path, path);
    });
    walk.Run(top, top == Tree::kRoot ? "" : documents_.GetTree().PathOf(top) + "/", request_.after);
}

void Searcher::TakeSorted(std::vector<Place> places) {
    const auto by_key = [](const Place& a, const Place& b) { return a.key < b.key; };
    const std::size_t wanted = std::min(Wanted(), places.size());
    std::partial_sort(places.begin(), places.begin() + static_cast<std::ptrdiff_t>(wanted),
                      places.end(), by_key);
    const bool by_id = request_.sort.empty();
    for (std::size_t i = 0; i < wanted; ++i) {
        std::string path = by_id ? places[i].key : documents_.GetTree().PathOf(places[i].id);
        if (!Emit(places[i].id, std::move(path), std::move(places[i].key))) {
            break;
        }
    }
}

void Searcher::BySort(const Plan& plan) {
    const Bitmap matches = matcher_.Match(plan);
    result_.total = matches.Count();
    SortOrder order(request_.sort, database_, documents_);
    for (const unsigned int field : order.TypedFields()) {
        if (!HasIndex(field)) {
            wanted_.insert(field);
        }
    }
    if (left_ == 0 || (result_.total > kFewForIndex && ByIndex(matches, order))) {
        return;
    }
    // Only as many as are wanted are kept: the worst of them on top of a heap.
    const std::size_t wanted = Wanted();
    std::vector<Place> places;
    const auto by_key = [](const Place& a, const Place& b) { return a.key < b.key; };
    matches.ForEach([&](std::int64_t id) {
        Place place{order.KeyOf(id), id};
        if (!request_.after.empty() && place.key <= request_.after) {
            return;
        }
        if (places.size() >= wanted && !by_key(place, places.front())) {
            return;
        }
        places.push_back(std::move(place));
        std::push_heap(places.begin(), places.end(), by_key);
        if (places.size() > wanted) {
            std::pop_heap(places.begin(), places.end(), by_key);
            places.pop_back();
        }
    });
    TakeSorted(std::move(places));
}

/// Meets the matches in the order of the first key, by its index, and puts those of equal first
/// keys in order; false when there is no such index. Costs what lies before the page, not what lies
/// behind it.
bool Searcher::ByIndex(const Bitmap& matches, SortOrder& order) {
    const std::optional<unsigned int> field = order.FirstTyped();
    if (!field || !HasIndex(*field)) {
        return false;
    }
    const std::string column = TypedColumn(*field);
    const char* direction = order.IsFirstDescending() ? " DESC" : "";
    Bitmap rest = matches;
    std::vector<Place> group;
    std::string group_value;
    const auto finish_group = [&] {
        for (Place& place : group) {
            place.key = order.KeyOf(place.id);
        }
        std::erase_if(group, [&](const Place& place) {
            return !request_.after.empty() && place.key <= request_.after;
        });
        TakeSorted(std::exchange(group, {}));
        return left_ > 0;
    };
    Statement walk(database_, "SELECT " + column + ", id FROM docs WHERE " + column +
                                  " IS NOT NULL ORDER BY " + column + direction);
    while (walk.Step()) {
        const std::int64_t id = walk.Int(1);
        if (!rest.Has(id)) {
            continue;
        }
        rest.Clear(id);
        const std::string value(walk.Bytes(0));
        if (value != group_value && !group.empty() && !finish_group()) {
            return true;
        }
        group_value = value;
        group.push_back({{}, id});
    }
    if (!group.empty() && !finish_group()) {
        return true;
    }
    rest.ForEach([&](std::int64_t id) { group.push_back({{}, id}); });
    finish_group();
    return true;
}

}  // namespace elasticd::engine::sqlite
