#include "programs/kestotifyd/fanotify_backend.h"

#include <fcntl.h>
#include <sys/fanotify.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <utility>

#include "common/log.h"
#include "programs/kestotifyd/file_handle.h"

namespace kestotifyd {
namespace {

constexpr std::uint64_t kMarkMask =
    FAN_CREATE | FAN_DELETE | FAN_RENAME | FAN_MODIFY | FAN_CLOSE_WRITE | FAN_ATTRIB | FAN_ONDIR;

constexpr int kMaxReads = 16;
constexpr std::size_t kMaxKnownPaths = 65536;  // per mount
constexpr std::size_t kMaxUncheckedRenames = 65536;

quivra::base::UniqueFd OpenDirectory(const std::string& path) {
    return quivra::base::UniqueFd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

std::string FileSystemOf(int fd) {
    struct statfs status {};
    if (fstatfs(fd, &status) != 0) {
        return std::string();
    }
    return std::string(reinterpret_cast<const char*>(&status.f_fsid), sizeof(status.f_fsid));
}

/// A structure of the kernel's at any address: events follow each other at multiples of four bytes
/// only.
template <typename T>
T Load(const char* bytes) {
    T value;
    std::memcpy(&value, bytes, sizeof(value));
    return value;
}

/// Reads one information record of an event.
void ReadRecord(const char* record, std::uint8_t type, FanotifyEvent& event) {
    const char* const bytes = record + offsetof(fanotify_event_info_fid, handle);
    const std::size_t size = sizeof(file_handle) + Load<file_handle>(bytes).handle_bytes;
    const std::string key(bytes, size);
    event.file_system.assign(record + offsetof(fanotify_event_info_fid, fsid),
                             sizeof(fanotify_event_info_fid::fsid));
    switch (type) {
        case FAN_EVENT_INFO_TYPE_FID:
            event.target = key;
            break;
        case FAN_EVENT_INFO_TYPE_DFID_NAME:
            event.place = {key, bytes + size};
            break;
        case FAN_EVENT_INFO_TYPE_OLD_DFID_NAME:
            event.old_place = {key, bytes + size};
            break;
        case FAN_EVENT_INFO_TYPE_NEW_DFID_NAME:
            event.new_place = {key, bytes + size};
            break;
        default:
            break;
    }
}

FanotifyEvent ReadEvent(const char* begin, const fanotify_event_metadata& metadata) {
    FanotifyEvent event;
    event.mask = metadata.mask;
    for (std::size_t at = metadata.metadata_len; at < metadata.event_len;) {
        const auto header = Load<fanotify_event_info_header>(begin + at);
        ReadRecord(begin + at, header.info_type, event);
        at += header.len;
    }
    return event;
}

}  // namespace

std::unique_ptr<FanotifyBackend> FanotifyBackend::Create(BackendSink& sink) {
    quivra::base::UniqueFd group(fanotify_init(
        FAN_CLASS_NOTIF | FAN_CLOEXEC | FAN_NONBLOCK | FAN_REPORT_DFID_NAME_TARGET, O_RDONLY));
    if (!group.IsValid()) {
        return nullptr;
    }
    return std::unique_ptr<FanotifyBackend>(new FanotifyBackend(sink, std::move(group)));
}

FanotifyBackend::FanotifyBackend(BackendSink& sink, quivra::base::UniqueFd group)
    : sink_(sink), group_(std::move(group)) {}

bool FanotifyBackend::AddRoot(const std::string& path) {
    const quivra::base::UniqueFd fd = OpenDirectory(path);
    const auto root = fd.IsValid() ? HandleOf(fd.Get()) : std::nullopt;
    if (!root) {
        return false;
    }
    // The way that every event's directory will go.
    const quivra::base::UniqueFd again = OpenHandle(fd.Get(), root->handle);
    if (!again.IsValid() || PathOfDescriptor(again.Get()) != path) {
        errno = again.IsValid() ? EXDEV : errno;
        return false;
    }
    if (fanotify_mark(group_.Get(), FAN_MARK_ADD | FAN_MARK_FILESYSTEM, kMarkMask, fd.Get(),
                      nullptr) != 0) {
        return false;
    }
    View& view = views_.try_emplace(root->mount_id, View{FileSystemOf(fd.Get())}).first->second;
    view.roots.insert(path);
    view.paths.Set(root->handle, path);
    completed_.push_back(path);
    return true;
}

void FanotifyBackend::RemoveRoot(const std::string& path) {
    for (auto it = views_.begin(); it != views_.end(); ++it) {
        if (it->second.roots.erase(path) == 0 || !it->second.roots.empty()) {
            continue;
        }
        const std::string file_system = it->second.file_system;
        views_.erase(it);
        for (const auto& [mount, view] : views_) {
            if (view.file_system == file_system) {
                return;
            }
        }
        // Fails when the file system is gone, and the mark with it.
        const quivra::base::UniqueFd fd = OpenDirectory(path);
        if (fd.IsValid() && FileSystemOf(fd.Get()) == file_system) {
            fanotify_mark(group_.Get(), FAN_MARK_REMOVE | FAN_MARK_FILESYSTEM, kMarkMask, fd.Get(),
                          nullptr);
        }
        return;
    }
}

void FanotifyBackend::Work(bool is_last) {
    bool is_empty = ReadEvents();
    while (is_last && !is_empty) {
        is_empty = ReadEvents();
    }
    for (auto& [mount, view] : views_) {
        if (is_empty || view.renames.size() > kMaxUncheckedRenames) {
            FinishTurn(view);
        }
    }
    if (is_empty) {
        CompleteRoots();
    }
}

/// Everything that the kernel had queued has been processed.
void FanotifyBackend::FinishTurn(View& view) {
    CheckRenames(view);
    view.renames_before = std::exchange(view.renames, {});
    view.paths.Settle();
    if (view.paths.Size() > kMaxKnownPaths) {
        view.paths.Clear();
    }
}

std::optional<Time> FanotifyBackend::NextDue() const {
    return completed_.empty() ? std::nullopt : std::optional(Time::min());
}

void FanotifyBackend::CompleteRoots() {
    for (const std::string& root : std::exchange(completed_, {})) {
        sink_.OnRootComplete(root);
    }
}

/// True when no event was left.
bool FanotifyBackend::ReadEvents() {
    std::array<char, 65536> buffer;
    for (int reads = 0; reads < kMaxReads; ++reads) {
        const ssize_t size = read(group_.Get(), buffer.data(), buffer.size());
        if (size <= 0) {
            return true;
        }
        for (const char* at = buffer.data(); at < buffer.data() + size;) {
            const auto metadata = Load<fanotify_event_metadata>(at);
            if ((metadata.mask & FAN_Q_OVERFLOW) != 0) {
                HandleOverflow();
            } else if (metadata.pid != getpid()) {
                Handle(ReadEvent(at, metadata));
            }
            at += metadata.event_len;
        }
    }
    return false;
}

void FanotifyBackend::Handle(const FanotifyEvent& event) {
    for (auto& [mount, view] : views_) {
        if (view.file_system != event.file_system) {
            continue;
        }
        const auto lookup = [this, &view = view](const std::string& handle) {
            return Lookup(view, handle);
        };
        for (const Change& change : TranslateFanotify(event, view.paths, lookup)) {
            sink_.OnChange(change);
            if (change.kind == Change::Kind::kRenamed) {
                view.renames.push_back({change.path_old, change.path, change.is_dir});
            }
        }
    }
}

/// The directory's path, and with it the paths of all directories above it, so that a later rename
/// of one of them shows that this one was ahead.
std::string FanotifyBackend::Lookup(View& view, const std::string& handle) const {
    const std::string known = view.paths.Find(handle);
    if (!known.empty()) {
        return known;
    }
    // No descriptor is kept open, for that would forbid to unmount.
    const quivra::base::UniqueFd mount = OpenDirectory(*view.roots.begin());
    const quivra::base::UniqueFd fd =
        mount.IsValid() ? OpenHandle(mount.Get(), handle) : quivra::base::UniqueFd();
    const std::string path = fd.IsValid() ? PathOfDescriptor(fd.Get()) : std::string();
    if (path.empty()) {
        return path;
    }
    view.paths.Set(handle, path);
    std::string above = path;
    for (std::size_t slash = above.rfind('/'); slash != 0; slash = above.rfind('/')) {
        above.resize(slash);
        const quivra::base::UniqueFd ancestor = OpenDirectory(above);
        const auto known_as = ancestor.IsValid() ? HandleOf(ancestor.Get()) : std::nullopt;
        if (!known_as || view.paths.Find(known_as->handle) == above) {
            break;
        }
        view.paths.Set(known_as->handle, above);
    }
    return path;
}

/// The kernel merges equal renames: of a -> b, b -> a, a -> b the first two arrive, and the object
/// seems to be at a. So each rename's result is compared with the disk. Where names were used too
/// early, all results are indexed again: also those of the turn before, for the event of a rename
/// is queued a moment after the disk shows it.
void FanotifyBackend::CheckRenames(const View& view) {
    using Kind = Change::Kind;
    for (const Rename& rename : view.renames) {
        struct stat status {};
        if (lstat(rename.to.c_str(), &status) != 0) {
            sink_.OnChange({Kind::kDeleted, rename.is_dir, rename.to});
        }
        if (lstat(rename.from.c_str(), &status) == 0) {
            sink_.OnChange({Kind::kCreated, S_ISDIR(status.st_mode), rename.from});
        }
    }
    if (view.paths.IsAhead()) {
        for (const std::vector<Rename>* const turn : {&view.renames_before, &view.renames}) {
            for (const Rename& rename : *turn) {
                sink_.OnChange({Kind::kReindex, true, rename.to});
            }
        }
    }
}

void FanotifyBackend::HandleOverflow() {
    errno = 0;
    quivra::LogError(
        {"fanotify", __LINE__},
        "The kernel's event queue overflowed: the watched shares will be indexed again "
        "as a whole. Raise the limit: sysctl fs.fanotify.max_queued_events=131072");
    completed_.clear();
    for (auto& [mount, view] : views_) {
        view.paths.Clear();
        for (const std::string& root : view.roots) {
            sink_.OnOverflow(root);
            completed_.push_back(root);
        }
    }
}

}  // namespace kestotifyd
