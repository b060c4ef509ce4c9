#pragma once

#include <memory>
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

/// Reads the text of a shares file. Lines that cannot be understood and sections that make no share
/// are reported to the system log and left out; all others count. A share's name must be the last
/// component of its path, and only the first section of a name counts. Letter case and blanks in
/// keys do not matter, keys that are not known are skipped. A line that begins with "#" or ";" is a
/// comment, and so is what follows a blank and ";".
ShareList ParseShares(std::string_view text);

/// The shares of /etc/kesto/shares.conf, read again when the file has changed. A missing file has
/// none; null, with the error set, when it cannot be read. Any thread may call it.
std::shared_ptr<const ShareList> LoadShares();

/// The share of that name, and the one with the longest root at or above a path; null when there is
/// none. They live as long as the list.
const ShareConf* FindShare(const ShareList& shares, std::string_view name);
const ShareConf* FindShareOfPath(const ShareList& shares, std::string_view full_path);

}  // namespace kesto
