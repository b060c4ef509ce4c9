#pragma once

#include "programs/kestoelasticd/engine/engine.h"

/// The engine on SQLite: one database file an index. See layout.h for its tables.
namespace elasticd::engine::sqlite {

engine::Creator Create;
engine::Opener Open;

}  // namespace elasticd::engine::sqlite
