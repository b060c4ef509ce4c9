#include "programs/kestoelasticd/engine/sqlite/matcher.h"

#include <sqlite3.h>

#include <algorithm>
#include <utility>

#include "programs/kestoelasticd/engine/sqlite/fts.h"

namespace elasticd::engine::sqlite {
namespace {

using ::sqlite::Statement;
using Kind = Plan::Kind;

/// Up to so many candidates are looked at one by one, each some microseconds.
constexpr std::size_t kFewCandidates = 2000;
constexpr unsigned int kVisitsBetweenChecks = 1024;

class BitmapVisitor : public MatchVisitor {
  public:
    explicit BitmapVisitor(const Deadline& deadline) : deadline_(deadline) {}

    bool Visit(const Fts5ExtensionApi& api, Fts5Context* context) override {
        matches.Set(api.xRowid(context));
        return ++visits_ % kVisitsBetweenChecks != 0 || !deadline_.HasPassed();
    }

    Bitmap matches;

  private:
    const Deadline& deadline_;
    unsigned int visits_ = 0;
};

/// How early a part of an "all" is looked at: what is quick and leaves few comes first.
int RankOf(const Plan& plan) {
    switch (plan.kind) {
        case Kind::kNode:
        case Kind::kChildren:
            return 0;
        case Kind::kWords:
            return 1;
        case Kind::kAll:
        case Kind::kAny:
            return 2;
        case Kind::kNot:
            return 4;
        default:
            return 3;
    }
}

void BindValue(Statement& statement, int parameter, const Value& value) {
    if (const auto* whole = std::get_if<std::int64_t>(&value)) {
        statement.Bind(parameter, *whole);
    } else if (const auto* real = std::get_if<double>(&value)) {
        statement.Bind(parameter, *real);
    } else {
        statement.BindBlob(parameter, std::get<std::string>(value));
    }
}

/// A statement for the documents whose typed column lies within the bounds; `first` begins it.
Statement MakeTyped(::sqlite::Database& database, const Plan& plan, const std::string& first) {
    const std::string column = TypedColumn(plan.field);
    std::string sql = first + column + " IS NOT NULL";
    if (plan.lower) {
        sql += " AND " + column + (plan.lower->inclusive ? ">=" : ">") + "?1";
    }
    if (plan.upper) {
        sql += " AND " + column + (plan.upper->inclusive ? "<=" : "<") + "?2";
    }
    Statement statement(database, sql);
    if (plan.lower) {
        BindValue(statement, 1, plan.lower->number);
    }
    if (plan.upper) {
        BindValue(statement, 2, plan.upper->number);
    }
    return statement;
}

Bitmap CollectIds(Statement statement) {
    Bitmap ids;
    while (statement.Step()) {
        ids.Set(statement.Int(0));
    }
    return ids;
}

}  // namespace

const Bitmap& Matcher::Everything() {
    if (!everything_) {
        everything_ = CollectIds(Statement(database_, "SELECT id FROM docs"));
    }
    return *everything_;
}

Bitmap Matcher::Match(const Plan& plan) {
    deadline_.Check();
    switch (plan.kind) {
        case Kind::kNothing:
            return {};
        case Kind::kEverything:
            return Everything();
        case Kind::kNode: {
            Bitmap one;
            one.Set(plan.node);
            return one;
        }
        case Kind::kWords:
            return MatchWords(plan);
        case Kind::kTyped:
            return CollectIds(MakeTyped(database_, plan, "SELECT id FROM docs WHERE "));
        case Kind::kChildren:
            return MatchChildren(plan);
        case Kind::kNames:
            return MatchNames(plan);
        case Kind::kBelow:
            return MatchBelow(plan);
        case Kind::kAll:
            return MatchAll(plan);
        case Kind::kAny: {
            Bitmap any;
            for (const Plan& part : plan.parts) {
                any.Or(Match(part));
            }
            return any;
        }
        case Kind::kNot: {
            Bitmap rest = Everything();
            rest.Remove(Match(plan.parts.front()));
            return rest;
        }
    }
    return {};
}

Bitmap Matcher::MatchAll(const Plan& plan) {
    std::vector<const Plan*> parts;
    for (const Plan& part : plan.parts) {
        parts.push_back(&part);
    }
    std::stable_sort(parts.begin(), parts.end(),
                     [](const Plan* a, const Plan* b) { return RankOf(*a) < RankOf(*b); });
    std::optional<Bitmap> left;
    for (const Plan* part : parts) {
        if (!left) {
            left = Match(*part);
        } else if (part->kind == Kind::kNot) {
            left->Remove(Match(part->parts.front()));
        } else if (!Narrow(*part, *left)) {
            left->And(Match(*part));
        }
    }
    return std::move(*left);
}

/// Looks at each of a few candidates; false when they are too many or that is no quicker.
bool Matcher::Narrow(const Plan& plan, Bitmap& candidates) {
    if ((plan.kind != Kind::kBelow && plan.kind != Kind::kTyped) ||
        candidates.Count() > kFewCandidates) {
        return false;
    }
    std::optional<Statement> typed;
    if (plan.kind == Kind::kTyped) {
        typed = MakeTyped(database_, plan, "SELECT id FROM docs WHERE id=?3 AND ");
    }
    const Bitmap before = candidates;
    before.ForEach([&](std::int64_t id) {
        const bool fits = typed ? typed->Bind(3, id).Step()
                                : tree_.IsBelow(id, plan.node) || (plan.itself && id == plan.node);
        if (typed) {
            typed->Reset();
        }
        if (!fits) {
            candidates.Clear(id);
        }
    });
    return true;
}

Bitmap Matcher::MatchWords(const Plan& plan) {
    BitmapVisitor visitor(deadline_);
    VisitMatches(database_, plan.expression, visitor);
    return std::move(visitor.matches);
}

Bitmap Matcher::MatchChildren(const Plan& plan) {
    Bitmap children;
    tree_.ForEachChild(plan.node, {}, [&](std::string_view, const Node& node) {
        if (node.has_document) {
            children.Set(node.id);
        }
        return true;
    });
    return children;
}

Bitmap Matcher::MatchNames(const Plan& plan) {
    if (plan.node == Tree::kRoot && plan.name.empty() && plan.itself) {
        return Everything();
    }
    Bitmap found;
    std::vector<std::int64_t> directories;
    tree_.ForEachChild(plan.node, plan.name, [&](std::string_view name, const Node& node) {
        if (!name.starts_with(plan.name)) {
            return false;
        }
        if (node.has_document && plan.itself) {
            found.Set(node.id);
        }
        if (node.has_children) {
            directories.push_back(node.id);
        }
        return true;
    });
    for (const std::int64_t directory : directories) {
        tree_.ForEachBelow(directory, [&](std::int64_t id) { found.Set(id); });
    }
    return found;
}

Bitmap Matcher::MatchBelow(const Plan& plan) {
    Bitmap found;
    tree_.ForEachBelow(plan.node, [&](std::int64_t id) { found.Set(id); });
    if (plan.itself) {
        const Tree::Position place = tree_.PositionOf(plan.node);
        if (const auto node = tree_.FindChild(place.first, place.second);
            node && node->has_document) {
            found.Set(node->id);
        }
    }
    return found;
}

}  // namespace elasticd::engine::sqlite
