#include "platform/standalone/shares_conf.h"
#include "base/file.h"
#include "base/path.h"

#include <fcntl.h>
#include <kesto/error.h>
#include <kesto/share.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <ctime>
#include <mutex>
#include <optional>

#include "base/unique_fd.h"
#include "platform/standalone/error_state.h"

namespace kesto {
namespace {

constexpr const char* kSharesPath = "/etc/kesto/shares.conf";
constexpr std::size_t kMaxFileSize = 4U << 20;
/// A file full of rubbish must not fill the system log as well.
constexpr int kMaxReports = 20;

std::string_view Trim(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(" \t\r");
    if (begin == std::string_view::npos) {
        return {};
    }
    return text.substr(begin, text.find_last_not_of(" \t\r") + 1 - begin);
}

/// The line without its comment: a semicolon counts at the start and behind a blank.
std::string_view WithoutComment(std::string_view line) {
    for (std::size_t i = line.find(';'); i < line.size(); i = line.find(';', i + 1)) {
        if (i == 0 || line[i - 1] == ' ' || line[i - 1] == '\t') {
            return Trim(line.substr(0, i));
        }
    }
    return line;
}

/// "Read Only" and "readonly" are one key.
std::string NormalizedKey(std::string_view key) {
    std::string normalized;
    for (const char c : key) {
        if (c != ' ' && c != '\t') {
            normalized += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        }
    }
    return normalized;
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

/// Whether every component between slashes is a real name, as in the paths that the kernel reports.
bool IsCanonical(std::string_view path) {
    if (!path.starts_with('/')) {
        return false;
    }
    for (std::size_t begin = 1; begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string_view component = path.substr(begin, end - begin);
        if (component.empty() || component == "." || component == "..") {
            return false;
        }
        begin = end + 1;
    }
    return true;
}

class Parser {
  public:
    ShareList Parse(std::string_view text) {
        if (text.starts_with("\xef\xbb\xbf")) {
            text.remove_prefix(3);
        }
        while (!text.empty()) {
            const std::size_t end = std::min(text.find('\n'), text.size());
            ++line_;
            TakeLine(WithoutComment(Trim(text.substr(0, end))));
            text.remove_prefix(std::min(end + 1, text.size()));
        }
        FinishSection();
        return std::move(shares_);
    }

  private:
    void TakeLine(std::string_view line) {
        const std::size_t equals = line.find('=');
        if (line.empty() || line[0] == '#') {
            return;
        }
        if (line.find('\0') != std::string_view::npos) {
            Report("the line holds a NUL byte");
        } else if (line[0] == '[') {
            FinishSection();
            if (line.back() == ']') {
                section_ = ShareConf();
                section_->name = Trim(line.substr(1, line.size() - 2));
                section_line_ = line_;
            } else {
                Report("the section's closing bracket is missing");
            }
        } else if (equals == std::string_view::npos) {
            Report("neither a section nor an assignment");
        } else if (section_) {
            Assign(NormalizedKey(line.substr(0, equals)), Trim(line.substr(equals + 1)));
        }
    }

    void Assign(const std::string& key, std::string_view value) {
        if (key == "path") {
            section_->path = value;
        } else if (key == "users") {
            section_->users = value;
        } else if (key == "ftpprivilege") {
            const char* end = value.data() + value.size();
            const auto [stop, error] = std::from_chars(value.data(), end, section_->ftp_privilege);
            if (error != std::errc() || stop != end) {
                section_->ftp_privilege = 0;
                Report("the ftp privilege is no number");
            }
        } else if (bool* flag = FlagOf(*section_, key)) {
            const std::optional<bool> parsed = ParseFlag(value);
            if (!parsed) {
                Report("the value is neither yes nor no");
            }
            *flag = parsed.value_or(*flag);
        }
    }

    void FinishSection() {
        if (section_) {
            const int line = line_;
            line_ = section_line_;
            const char* refusal = Refusal(*section_);
            if (refusal == nullptr) {
                shares_.push_back(std::move(*section_));
            } else {
                Report(refusal);
            }
            line_ = line;
        }
        section_.reset();
    }

    /// Why a section makes no share; null when it does.
    const char* Refusal(const ShareConf& share) const {
        if (share.path.empty()) {
            return "the section has no path";
        }
        if (!IsCanonical(share.path)) {
            return "the path is not absolute, or has empty, \".\" or \"..\" parts";
        }
        if (share.name != quivra::base::Name(share.path)) {
            return "the section's name is not the last component of its path";
        }
        if (share.name.size() >= sizeof(KESTOShare::szName) ||
            share.path.size() >= sizeof(KESTOShare::szPath) ||
            share.users.size() >= sizeof(KESTOShare::szUsers)) {
            return "the name, the path or the list of users is too long";
        }
        return FindShare(shares_, share.name) == nullptr ? nullptr : "the share exists already";
    }

    void Report(const char* reason) {
        if (++reports_ <= kMaxReports) {
            syslog(LOG_WARNING, "%s:%d ignored: %s", kSharesPath, line_, reason);
        }
    }

    ShareList shares_;
    std::optional<ShareConf> section_;
    int section_line_ = 0;
    int line_ = 0;
    int reports_ = 0;
};

/// What tells one state of the file from another.
struct FileState {
    dev_t device;
    ino_t inode;
    off_t size;
    timespec modified;

    bool operator==(const FileState& other) const {
        return device == other.device && inode == other.inode && size == other.size &&
               modified.tv_sec == other.modified.tv_sec &&
               modified.tv_nsec == other.modified.tv_nsec;
    }
};

FileState StateOf(const struct stat& status) {
    return {status.st_dev, status.st_ino, status.st_size, status.st_mtim};
}

/// Whether the file could change once more without a new modification time: the kernel stamps with
/// the time of its last tick.
bool IsTooFresh(const timespec& modified) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    return now.tv_sec - modified.tv_sec <= 1;
}

struct Cache {
    std::mutex mutex;
    std::optional<FileState> state;  ///< of the file that `shares` was read from
    std::shared_ptr<const ShareList> shares;
};

/// Reads the file anew; null with errno set on failure.
std::shared_ptr<const ShareList> ReadShares(Cache& cache) {
    const quivra::base::UniqueFd fd(
        open(kSharesPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!fd.IsValid() || fstat(fd.Get(), &status) != 0) {
        return nullptr;
    }
    std::string text;
    if (!S_ISREG(status.st_mode) || !quivra::base::ReadUpTo(fd.Get(), kMaxFileSize + 1, text) ||
        text.size() > kMaxFileSize) {
        errno = errno == 0 ? EFBIG : errno;
        return nullptr;
    }
    cache.shares = std::make_shared<const ShareList>(ParseShares(text));
    if (!IsTooFresh(status.st_mtim)) {
        cache.state = StateOf(status);
    }
    return cache.shares;
}

}  // namespace

ShareList ParseShares(std::string_view text) {
    return Parser().Parse(text);
}

std::shared_ptr<const ShareList> LoadShares() {
    static Cache cache;
    const std::lock_guard lock(cache.mutex);
    struct stat status {};
    if (stat(kSharesPath, &status) == 0 && cache.state == StateOf(status)) {
        return cache.shares;
    }
    cache.state.reset();
    const int saved_errno = errno;
    errno = 0;
    std::shared_ptr<const ShareList> shares = ReadShares(cache);
    if (shares == nullptr && (errno == ENOENT || errno == ENOTDIR)) {
        shares = std::make_shared<const ShareList>();
    }
    if (shares == nullptr) {
        syslog(LOG_ERR, "%s cannot be read: %s", kSharesPath, std::strerror(errno));
        SetError(KESTO_ERR_SYSTEM);
    } else {
        errno = saved_errno;
    }
    return shares;
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
