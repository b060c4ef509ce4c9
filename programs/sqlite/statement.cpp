#include "programs/sqlite/statement.h"

#include <sqlite3.h>

#include <utility>

namespace sqlite {

Statement::Statement(Database& database, std::string_view sql) {
    const int code = sqlite3_prepare_v3(database.Handle(), sql.data(), static_cast<int>(sql.size()),
                                        SQLITE_PREPARE_PERSISTENT, &handle_, nullptr);
    Check(database.Handle(), code, "prepare");
}

Statement::~Statement() {
    sqlite3_finalize(handle_);
}

Statement::Statement(Statement&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

Statement& Statement::operator=(Statement&& other) noexcept {
    std::swap(handle_, other.handle_);
    return *this;
}

sqlite3* Statement::Owner() const {
    return sqlite3_db_handle(handle_);
}

Statement& Statement::Bind(int parameter, std::int64_t value) {
    Check(Owner(), sqlite3_bind_int64(handle_, parameter, value), "bind");
    return *this;
}

Statement& Statement::Bind(int parameter, double value) {
    Check(Owner(), sqlite3_bind_double(handle_, parameter, value), "bind");
    return *this;
}

Statement& Statement::BindText(int parameter, std::string_view value) {
    Check(Owner(),
          sqlite3_bind_text64(handle_, parameter, value.data() == nullptr ? "" : value.data(),
                              value.size(), SQLITE_STATIC, SQLITE_UTF8),
          "bind");
    return *this;
}

Statement& Statement::BindBlob(int parameter, std::string_view value) {
    // A null pointer would bind NULL in the place of the empty blob.
    Check(Owner(),
          sqlite3_bind_blob64(handle_, parameter, value.data() == nullptr ? "" : value.data(),
                              value.size(), SQLITE_STATIC),
          "bind");
    return *this;
}

Statement& Statement::BindNull(int parameter) {
    Check(Owner(), sqlite3_bind_null(handle_, parameter), "bind");
    return *this;
}

Statement& Statement::BindPointer(int parameter, void* value, const char* type) {
    Check(Owner(), sqlite3_bind_pointer(handle_, parameter, value, type, nullptr), "bind");
    return *this;
}

bool Statement::Step() {
    const int code = sqlite3_step(handle_);
    if (code == SQLITE_ROW) {
        return true;
    }
    try {
        Check(Owner(), code, sqlite3_sql(handle_));
    } catch (...) {
        Reset();
        throw;
    }
    Reset();
    return false;
}

void Statement::Run() {
    while (Step()) {
    }
}

void Statement::Reset() noexcept {
    sqlite3_reset(handle_);
}

bool Statement::IsNull(int column) const {
    return sqlite3_column_type(handle_, column) == SQLITE_NULL;
}

std::int64_t Statement::Int(int column) const {
    return sqlite3_column_int64(handle_, column);
}

double Statement::Double(int column) const {
    return sqlite3_column_double(handle_, column);
}

std::string_view Statement::Bytes(int column) const {
    const void* bytes = sqlite3_column_blob(handle_, column);
    const int size = sqlite3_column_bytes(handle_, column);
    return {static_cast<const char*>(bytes), static_cast<std::size_t>(size)};
}

}  // namespace sqlite
