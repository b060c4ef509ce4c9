#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/unique_fd.h"
#include "programs/kestotifyd/backend.h"
#include "programs/kestotifyd/fanotify_translation.h"
#include "programs/kestotifyd/handle_paths.h"
#include "programs/kestotifyd/rename_check.h"

namespace kestotifyd {

/// Watches whole file systems with one mark each (Linux 5.17, CAP_SYS_ADMIN and
/// CAP_DAC_READ_SEARCH), and reports what happens below its roots. A file system that is mounted in
/// several places is reported as each of these mounts shows it, where a root lies in it.
class FanotifyBackend : public Backend {
  public:
    /// Null, with errno set, when the kernel or our rights do not suffice.
    static std::unique_ptr<FanotifyBackend> Create(BackendSink& sink);

    int Fd() const override { return group_.Get(); }

    /// Also false when the file system does not support what is needed, which is tried out.
    bool AddRoot(const std::string& path) override;
    void RemoveRoot(const std::string& path) override;
    void Rescan(const std::string& path) override { completed_.push_back(path); }
    void Work(bool is_last) override;
    std::optional<Time> NextDue() const override;
    Coverage CoverageOf(const std::string& root) const override;

  private:
    /// One mount, as far as roots lie in it.
    struct View {
        std::string file_system;
        std::map<std::string, std::string> roots{};  ///< handles by path
        HandlePaths paths{};
        RenameCheck renames{};
        bool is_blind = false;  ///< events were dropped, because descriptors or memory are short
    };

    FanotifyBackend(BackendSink& sink, quivra::base::UniqueFd group);

    bool ReadEvents(Time end);
    void Handle(const FanotifyEvent& event);
    void DropMovedRoots(const FanotifyEvent& event);
    void HandleOverflow();
    void CompleteRoots();
    void FinishTurn(View& view, bool is_empty);
    void RecoverSight();
    std::string Lookup(View& view, const std::string& handle) const;
    std::string LookUpOnDisk(View& view, const std::string& handle) const;

    BackendSink& sink_;
    quivra::base::UniqueFd group_;
    std::map<int, View> views_;  ///< by mount id
    std::vector<std::string> completed_;
    std::optional<Time> sight_due_;  ///< when to try whether a blind view can see again
};

}  // namespace kestotifyd
