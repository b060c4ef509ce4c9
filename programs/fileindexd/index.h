#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace fileindexd {

/// What tells whether an object is still the one that was indexed. Times are nanoseconds since the
/// epoch. The inode tells two files of the same name, size and age apart, whose directories were
/// exchanged.
struct Attributes {
    bool is_dir = false;
    std::int64_t size = 0;
    std::int64_t modified = 0;  ///< the content, st_mtime
    std::int64_t changed = 0;   ///< anything, st_ctime
    std::uint64_t inode = 0;    ///< 0: not known, which no object is like

    bool operator==(const Attributes&) const = default;
};

/// What the index holds about one object.
struct Document {
    std::string path;
    Attributes attributes;
    std::string content_error;    ///< why it lacks the content that was wanted; empty: it does not
    bool error_can_pass = false;  ///< another try may succeed although the file stays as it is
};

/// An object that could not be read, or not in full.
struct Problem {
    std::string path;
    std::string reason;
    bool can_pass = true;  ///< another try may succeed although the object stays as it is
};

/// The index refused one document, or its file could not be read: no reason to stop a pass.
class DocumentError : public std::runtime_error {
  public:
    DocumentError(const std::string& reason, bool may_pass)
        : std::runtime_error(reason), can_pass(may_pass) {}

    bool can_pass;  ///< another try may succeed although the file stays as it is
};

/// One share's index, as a pass sees it. Changes become visible to Find and ListBelow with Commit.
/// Every call may throw quivra::Error, which means that the index itself cannot be worked with.
class Index {
  public:
    virtual ~Index() = default;

    /// Both read the object at the path and may throw DocumentError. SetAttributes is false when
    /// there is no such document.
    virtual void Upsert(const std::string& path, bool need_meta) = 0;
    virtual bool SetAttributes(const std::string& path) = 0;

    /// Moves the document and all below it, as they were committed last. False, and nothing has
    /// moved, when there is no document at `from`.
    virtual bool Rename(const std::string& to, const std::string& from) = 0;

    virtual void Delete(const std::string& path) = 0;
    /// Deletes every document below the directory, not its own.
    virtual void DeleteBelow(const std::string& directory) = 0;

    virtual void Commit() = 0;

    /// The committed documents below a directory whose paths come behind `after`, in the order of
    /// their bytes, one page of them.
    virtual std::vector<Document> ListBelow(const std::string& directory, const std::string& after,
                                            std::size_t limit) = 0;
    /// The committed documents of these paths, in any order.
    virtual std::vector<Document> Find(const std::vector<std::string>& paths) = 0;
};

}  // namespace fileindexd
