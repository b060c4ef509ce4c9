#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/unique_fd.h"
#include "programs/kestotifyd/backend.h"
#include "programs/kestotifyd/fanotify_translation.h"
#include "programs/kestotifyd/handle_paths.h"

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

  private:
    struct Rename {
        std::string from;
        std::string to;
        bool is_dir;
    };
    /// One mount, as far as roots lie in it.
    struct View {
        std::string file_system;
        std::set<std::string> roots{};
        HandlePaths paths{};
        std::vector<Rename> renames{};         ///< since the kernel's queue was last empty
        std::vector<Rename> renames_before{};  ///< and in the turn before that
    };

    FanotifyBackend(BackendSink& sink, quivra::base::UniqueFd group);

    bool ReadEvents();
    void Handle(const FanotifyEvent& event);
    void HandleOverflow();
    void CompleteRoots();
    void FinishTurn(View& view);
    void CheckRenames(const View& view);
    std::string Lookup(View& view, const std::string& handle) const;

    BackendSink& sink_;
    quivra::base::UniqueFd group_;
    std::map<int, View> views_;  ///< by mount id
    std::vector<std::string> completed_;
};

}  // namespace kestotifyd
