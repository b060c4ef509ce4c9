#include "programs/kestoelasticd/engine/sqlite/fts.h"

#include <sqlite3.h>

#include <exception>
#include <new>

#include "programs/kestoelasticd/engine/sqlite/tokens.h"
#include "programs/sqlite/statement.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr char kPointerType[] = "elasticd-visitor";

using GiveToken = int (*)(void*, int, const char*, int, int, int);

int CreateTokenizer(void* /*context*/, const char** /*arguments*/, int /*count*/,
                    Fts5Tokenizer** out) {
    static char stateless;
    *out = reinterpret_cast<Fts5Tokenizer*>(&stateless);
    return SQLITE_OK;
}

void DeleteTokenizer(Fts5Tokenizer* /*tokenizer*/) {}

/// A query's strings are tokens already. No exception may pass through SQLite.
int Tokenize(Fts5Tokenizer* /*tokenizer*/, void* context, int flags, const char* text, int size,
             GiveToken give) {
    if ((flags & FTS5_TOKENIZE_QUERY) != 0) {
        return give(context, 0, text, size, 0, size);
    }
    struct Target {
        void* context;
        GiveToken give;
    } target{context, give};
    try {
        return TokenizeColumn(
            {text, static_cast<std::size_t>(size)},
            [](void* to, std::string_view token, bool same_place) {
                const auto* out = static_cast<Target*>(to);
                return out->give(out->context, same_place ? FTS5_TOKEN_COLOCATED : 0, token.data(),
                                 static_cast<int>(token.size()), 0, 0);
            },
            &target);
    } catch (...) {
        return SQLITE_NOMEM;
    }
}

/// visit(words, POINTER): no exception may pass here either, so what the visitor throws counts as
/// an interruption.
void VisitFunction(const Fts5ExtensionApi* api, Fts5Context* context, sqlite3_context* result,
                   int count, sqlite3_value** values) {
    auto* visitor = count == 1
                        ? static_cast<MatchVisitor*>(sqlite3_value_pointer(values[0], kPointerType))
                        : nullptr;
    bool go_on = false;
    try {
        go_on = visitor != nullptr && visitor->Visit(*api, context);
    } catch (...) {
    }
    if (go_on) {
        sqlite3_result_int(result, 0);
    } else {
        sqlite3_result_error_code(result, SQLITE_INTERRUPT);
    }
}

fts5_api* FindApi(::sqlite::Database& database) {
    fts5_api* api = nullptr;
    ::sqlite::Statement(database, "SELECT fts5(?1)").BindPointer(1, &api, "fts5_api_ptr").Run();
    if (api == nullptr) {
        throw ::sqlite::Error(SQLITE_ERROR, "SQLite was built without its full-text table");
    }
    return api;
}

}  // namespace

void RegisterFts(::sqlite::Database& database) {
    fts5_api* api = FindApi(database);
    fts5_tokenizer tokenizer{CreateTokenizer, DeleteTokenizer, Tokenize};
    ::sqlite::Check(database.Handle(),
                    api->xCreateTokenizer(api, "elasticd", nullptr, &tokenizer, nullptr),
                    "tokenizer");
    ::sqlite::Check(database.Handle(),
                    api->xCreateFunction(api, "visit", nullptr, VisitFunction, nullptr), "visit");
}

void VisitMatches(::sqlite::Database& database, const std::string& expression,
                  MatchVisitor& visitor) {
    // As a condition that is never true, so that a match costs no return to this function.
    ::sqlite::Statement scan(database,
                             "SELECT 1 FROM words WHERE words MATCH ?1 AND visit(words, ?2)");
    scan.BindText(1, expression).BindPointer(2, &visitor, kPointerType).Run();
}

}  // namespace elasticd::engine::sqlite
