#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kesto {

/// One section of the shares file:
///
///   [photo]
///   path = /volume1/photo
///   read only = no
///   hide unreadable = no
///   encryption = no
///   encrypted = no
///   recycle = yes
///   ftp privilege = 0
///   users = alice:rw bob:ro
struct ShareConf {
    std::string name;
    std::string path;
    unsigned int ftp_privilege = 0;
    bool read_only = false;
    bool hide_unreadable = false;
    bool encryption = false;
    bool encrypted = false;
    bool recycle = false;
    std::string users;
};

using ShareList = std::vector<ShareConf>;

inline constexpr const char* kSharesPath = "/etc/kesto/shares.conf";

struct SharesConf {
    ShareList shares;
    /// "/etc/kesto/shares.conf:LINE: what is wrong there", in the order of the file.
    std::vector<std::string> problems;
    bool is_readable = true;  ///< a missing file counts as an empty one
};

/// Reads the text of a shares file. Lines that cannot be understood and sections that make no share
/// become problems and are left out; all others count. A share's name must be the last component of
/// its path, and only the first section of a name counts. Letter case and blanks in keys do not
/// matter. A line that begins with "#" or ";" is a comment, and so is what follows a blank and ";".
/// The first 20 problems are told, and how many there are beyond.
SharesConf ParseShares(std::string_view text);

/// One entry of a list of users' rights, "NAME:rw" or "NAME:ro"; name and right are empty when it
/// has no colon.
struct UserRight {
    std::string_view entry;
    std::string_view name;
    std::string_view right;
};

/// Takes the next entry off the list; nothing at its end.
std::optional<UserRight> NextUser(std::string_view& users);

/// The shares of /etc/kesto/shares.conf, read again when the file has changed. A missing file has
/// none; null, with the error set, when it cannot be read. Problems are logged once for each state
/// of the file. Any thread may call it.
std::shared_ptr<const ShareList> LoadShares();

/// The share of that name, and the one with the longest root at or above a path; null when there is
/// none. They live as long as the list.
const ShareConf* FindShare(const ShareList& shares, std::string_view name);
const ShareConf* FindShareOfPath(const ShareList& shares, std::string_view full_path);

}  // namespace kesto
