#include "platform/standalone/shares_conf.h"

#include <kesto/share.h>

#include <algorithm>
#include <charconv>
#include <optional>

#include "base/path.h"

namespace kesto {
namespace {

/// A file full of rubbish must not fill the system log as well.
constexpr std::size_t kMaxProblems = 20;
constexpr std::size_t kMaxQuote = 60;

std::string_view Trim(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(" \t\r");
    if (begin == std::string_view::npos) {
        return {};
    }
    return text.substr(begin, text.find_last_not_of(" \t\r") + 1 - begin);
}

/// The line without its comment: a semicolon counts at the start and behind a blank.
std::string_view WithoutComment(std::string_view line) {
    // Only behind a blank, because a directory's name may hold one.
    for (std::size_t i = line.find(';'); i < line.size(); i = line.find(';', i + 1)) {
        if (i == 0 || line[i - 1] == ' ' || line[i - 1] == '\t') {
            return Trim(line.substr(0, i));
        }
    }
    return line;
}

/// "Read Only" and "readonly" are one key, whatever the host program's locale makes of letters.
std::string NormalizedKey(std::string_view key) {
    std::string normalized;
    for (const char c : key) {
        if (c != ' ' && c != '\t') {
            normalized += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
        }
    }
    return normalized;
}

/// A piece of the file for a message: short, and nothing that a terminal would obey.
std::string Quote(std::string_view text) {
    std::string quoted = "\"" + std::string(text.substr(0, kMaxQuote));
    std::replace_if(
        quoted.begin(), quoted.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; }, '?');
    return quoted + (text.size() > kMaxQuote ? "...\"" : "\"");
}

std::optional<bool> ParseFlag(std::string_view value) {
    const std::string text = NormalizedKey(value);
    if (text == "yes" || text == "true" || text == "1") {
        return true;
    }
    if (text == "no" || text == "false" || text == "0") {
        return false;
    }
    return std::nullopt;
}

bool* FlagOf(ShareConf& share, std::string_view key) {
    return key == "readonly"         ? &share.read_only
           : key == "hideunreadable" ? &share.hide_unreadable
           : key == "encryption"     ? &share.encryption
           : key == "encrypted"      ? &share.encrypted
           : key == "recycle"        ? &share.recycle
                                     : nullptr;
}

class Parser {
  public:
    SharesConf Parse(std::string_view text) {
        if (text.starts_with("\xef\xbb\xbf")) {  // some editors begin UTF-8 files with a mark
            text.remove_prefix(3);
        }
        while (!text.empty()) {
            const std::size_t end = std::min(text.find('\n'), text.size());
            ++line_;
            TakeLine(WithoutComment(Trim(text.substr(0, end))));
            text.remove_prefix(std::min(end + 1, text.size()));
        }
        FinishSection();
        if (unreported_ > 0) {
            conf_.problems.push_back(std::string(kSharesPath) + ": " + std::to_string(unreported_) +
                                     " more lines are wrong");
        }
        return std::move(conf_);
    }

  private:
    void TakeLine(std::string_view line) {
        const std::size_t equals = line.find('=');
        if (line.empty() || line[0] == '#') {
            return;
        }
        if (line.find('\0') != std::string_view::npos) {
            Report(line_, "the line holds a NUL byte");
        } else if (line[0] == '[') {
            BeginSection(line);
        } else if (equals == std::string_view::npos) {
            Report(line_, "neither a section nor an assignment: " + Quote(line));
        } else if (section_) {
            Assign(Trim(line.substr(0, equals)), Trim(line.substr(equals + 1)));
        } else if (!is_in_bad_section_) {
            Report(line_, "the assignment stands before the first section: " + Quote(line));
        }
    }

    void BeginSection(std::string_view line) {
        FinishSection();
        section_line_ = path_line_ = line_;
        is_in_bad_section_ = line.back() != ']';
        if (is_in_bad_section_) {
            Report(line_, "the section's closing bracket is missing: " + Quote(line));
        } else {
            section_ = ShareConf();
            section_->name = Trim(line.substr(1, line.size() - 2));
        }
    }

    void Assign(std::string_view written_key, std::string_view value) {
        const std::string key = NormalizedKey(written_key);
        if (key == "path") {
            section_->path = value;
            path_line_ = line_;
        } else if (key == "users") {
            section_->users = value;
            CheckUsers(value);
        } else if (key == "ftpprivilege") {
            const char* end = value.data() + value.size();
            const auto [stop, error] = std::from_chars(value.data(), end, section_->ftp_privilege);
            // The least right, as with every value that cannot be understood.
            if (error != std::errc() || stop != end) {
                section_->ftp_privilege = 0;
                Report(line_, "the ftp privilege is not a number: " + Quote(value));
            }
        } else if (bool* flag = FlagOf(*section_, key)) {
            const std::optional<bool> parsed = ParseFlag(value);
            if (!parsed) {
                Report(line_, "the value is neither yes nor no: " + Quote(value));
            }
            *flag = parsed.value_or(*flag);
        } else {
            Report(line_, "unknown key " + Quote(written_key));
        }
    }

    void CheckUsers(std::string_view users) {
        while (const std::optional<UserRight> user = NextUser(users)) {
            if (user->name.empty() || (user->right != "rw" && user->right != "ro")) {
                Report(line_, "not NAME:rw or NAME:ro: " + Quote(user->entry));
            }
        }
    }

    void FinishSection() {
        if (section_) {
            if (CheckPath(*section_) && CheckSection(*section_)) {
                conf_.shares.push_back(std::move(*section_));
            }
        }
        section_.reset();
    }

    bool CheckPath(const ShareConf& share) {
        const std::string_view path = share.path;
        if (path.empty()) {
            return Refuse(section_line_, "the section has no path: " + Quote(share.name));
        }
        if (path.size() > 1 && path.ends_with('/')) {
            return Refuse(path_line_, "the path ends with a slash; remove it: " + Quote(path));
        }
        if (path == "/" || !quivra::base::IsCanonicalText(path)) {
            return Refuse(
                path_line_,
                "the path is not absolute, or has empty, \".\" or \"..\" parts: " + Quote(path));
        }
        if (share.name != quivra::base::Name(path)) {
            return Refuse(
                section_line_,
                "the section's name is not the last component of its path: " + Quote(share.name));
        }
        return true;
    }

    bool CheckSection(const ShareConf& share) {
        if (share.name.size() >= sizeof(KESTOShare::szName) ||
            share.path.size() >= sizeof(KESTOShare::szPath) ||
            share.users.size() >= sizeof(KESTOShare::szUsers)) {
            return Refuse(section_line_, "the name, the path or the list of users is too long");
        }
        // The first one stays: an addition at the end of the file must not move a share elsewhere.
        return FindShare(conf_.shares, share.name) == nullptr ||
               Refuse(section_line_, "the share exists already: " + Quote(share.name));
    }

    /// Reports why a section makes no share.
    bool Refuse(int line, const std::string& reason) {
        Report(line, reason);
        return false;
    }

    void Report(int line, const std::string& reason) {
        if (conf_.problems.size() < kMaxProblems) {
            conf_.problems.push_back(std::string(kSharesPath) + ":" + std::to_string(line) + ": " +
                                     reason);
        } else {
            ++unreported_;
        }
    }

    SharesConf conf_;
    std::optional<ShareConf> section_;
    bool is_in_bad_section_ = false;  ///< its assignments belong to no share
    int section_line_ = 0;
    int path_line_ = 0;
    int line_ = 0;
    int unreported_ = 0;
};

}  // namespace

SharesConf ParseShares(std::string_view text) {
    return Parser().Parse(text);
}

std::optional<UserRight> NextUser(std::string_view& users) {
    constexpr const char* kSeparators = " \t,";
    users.remove_prefix(std::min(users.find_first_not_of(kSeparators), users.size()));
    if (users.empty()) {
        return std::nullopt;
    }
    const std::string_view entry = users.substr(0, users.find_first_of(kSeparators));
    users.remove_prefix(entry.size());
    const std::size_t colon = entry.rfind(':');
    if (colon == entry.npos) {
        return UserRight{entry, {}, {}};
    }
    return UserRight{entry, entry.substr(0, colon), entry.substr(colon + 1)};
}

const ShareConf* FindShare(const ShareList& shares, std::string_view name) {
    const auto it = std::find_if(shares.begin(), shares.end(),
                                 [&](const ShareConf& share) { return share.name == name; });
    return it == shares.end() ? nullptr : &*it;
}

const ShareConf* FindShareOfPath(const ShareList& shares, std::string_view full_path) {
    while (full_path.size() > 1 && full_path.ends_with('/')) {
        full_path.remove_suffix(1);
    }
    const ShareConf* found = nullptr;
    for (const ShareConf& share : shares) {
        if (quivra::base::IsAtOrBelow(full_path, share.path) &&
            (found == nullptr || share.path.size() > found->path.size())) {
            found = &share;
        }
    }
    return found;
}

}  // namespace kesto
