#pragma once

#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/unique_fd.h"
#include "programs/kestotifyd/backend.h"
#include "programs/kestotifyd/inotify_translation.h"
#include "programs/kestotifyd/move_pairing.h"
#include "programs/kestotifyd/rename_check.h"
#include "programs/kestotifyd/watch_tree.h"

namespace kestotifyd {

/// Watches directory trees with one inotify watch per directory. Symbolic links are not followed
/// and file systems mounted below a root are left out.
///
/// The tree stands at the position in the event stream that has been processed, the disk may be
/// ahead of it. So every watch is set through an opened directory that has been proved to be the
/// one that the tree means; where the proof fails, the events that explain it are on their way, and
/// the directory is tried again after them.
class InotifyBackend : public Backend {
  public:
    /// Watches at most `max_watches` directories; 0 stands for 80 % of the system's limit for a
    /// user, which other programs share. Null, with errno set, when the kernel refuses inotify.
    static std::unique_ptr<InotifyBackend> Create(BackendSink& sink, std::size_t max_watches = 0);

    int Fd() const override { return inotify_.Get(); }
    bool AddRoot(const std::string& path) override;
    void RemoveRoot(const std::string& path) override;
    void Rescan(const std::string& path) override;
    void Work(bool is_last) override;
    std::optional<Time> NextDue() const override;
    Coverage CoverageOf(const std::string& root) const override;

  private:
    InotifyBackend(BackendSink& sink, quivra::base::UniqueFd inotify, std::size_t max_watches);

    /// A walk over a tree that sets watches, and what to tell when it is through.
    struct Scan {
        NodeRef top;
        bool is_rescan = false;  ///< go below what is watched already, and drop what is gone
        std::vector<NodeRef> pending{};
    };

    /// An entry, perhaps a new directory, whose watch is to be made sure of.
    struct Retry {
        NodeRef parent;
        std::string name;  ///< empty: the parent itself is to be scanned
        Time due;
        int attempts;
    };

    void ReadEvents();
    void Process(bool is_last);
    void Handle(const MovePairing::Paired& paired);
    void HandleOverflow();
    void StartRescans();
    bool IsRoomFree();
    /// Whether the error says that a directory is there and cannot be watched.
    static bool IsRefusal(int error_number);

    int Watch(const std::string& path, bool follow);
    void Release(const std::vector<int>& watches);
    quivra::base::UniqueFd OpenVerified(WatchNode& node);

    /// How an entry of a directory stands after EnsureChild.
    struct Child {
        enum class State {
            kPresent,  ///< was watched at this place
            kMoved,    ///< was watched at another place, with everything below it
            kNew,      ///< is to be scanned
            kAbsent,   ///< no directory, or not wanted
            kRefused,  ///< the kernel or our own limit forbids the watch
        };
        State state;
        WatchNode* node = nullptr;
    };
    Child EnsureChild(WatchNode& parent, int parent_fd, const std::string& name);
    Child Adopt(WatchNode& parent, const std::string& name, int wd);
    void Appear(const NodeRef& parent, const std::string& name, int attempts);
    void Postpone(const NodeRef& parent, const std::string& name, int attempts);
    void WorkRetries(bool is_last);

    void WorkScans();
    void ScanDirectory(Scan& scan, const NodeRef& ref);
    void DropMissing(WatchNode& node, const std::set<std::string_view>& names);
    void Finish(const Scan& scan);
    void Refuse(int error_number, const std::string& root, const std::string& path);
    std::string DescribeRefusal(int error_number) const;

    BackendSink& sink_;
    quivra::base::UniqueFd inotify_;
    std::size_t configured_limit_;
    std::size_t limit_ = 0;
    WatchTree tree_;
    MovePairing pairing_;
    std::deque<Scan> scans_;
    std::vector<Retry> retries_;
    std::optional<Time> rescan_due_;
    RenameCheck renames_;

    /// By root: the directories that were refused since its last rescan began.
    std::map<std::string, std::size_t> unwatched_;
    std::string problem_;          ///< of the last refusal, in one sentence
    std::string refused_path_;     ///< to try whether it would be refused again
    Time next_gap_check_{};        ///< while something is unwatched
    Time gap_rescan_{};            ///< not before that, even when something has come free
    Time forced_rescan_{};         ///< even when nothing seems to have come free
    Clock::duration gap_delay_{};  ///< between the last rescan and gap_rescan_
};

}  // namespace kestotifyd
