#pragma once

#include <string>

#include "programs/sqlite/database.h"

struct Fts5ExtensionApi;
struct Fts5Context;

/// What we add to SQLite's full-text table: the tokenizer and a function that sees each match.
namespace elasticd::engine::sqlite {

/// Is shown each match of a full-text query, from inside the scan: no row is made for it.
class MatchVisitor {
  public:
    virtual ~MatchVisitor() = default;
    /// False ends the scan with SQLITE_INTERRUPT.
    virtual bool Visit(const Fts5ExtensionApi& api, Fts5Context* context) = 0;
};

/// Makes the tokenizer "elasticd" and the function visit(words, POINTER) known to a connection:
/// each connection needs it before it touches the full-text table.
void RegisterFts(::sqlite::Database& database);

/// Shows `visitor` all that matches the expression of the full-text table's query language.
void VisitMatches(::sqlite::Database& database, const std::string& expression,
                  MatchVisitor& visitor);

}  // namespace elasticd::engine::sqlite
