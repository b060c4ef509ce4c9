#include "programs/fileindexd/share_worker.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <ctime>

#include "base/unique_fd.h"
#include "common/log.h"
#include "fileindex/index_mgr.h"
#include "programs/fileindexd/elastic_index.h"
#include "programs/fileindexd/repair.h"
#include "sdk/share.h"

namespace fileindexd {

using quivra::Error;

namespace {

constexpr const char* kUnit = "share_worker";

/// Held during a pass, so that `--once` and a worker do not take the same working copy.
quivra::base::UniqueFd LockShare(const std::string& share, const std::function<void()>& between) {
    const std::string path = std::string(kRunDirectory) + "/" + share + ".lock";
    quivra::base::UniqueFd fd(open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    int result = fd.IsValid() ? flock(fd.Get(), LOCK_EX) : -1;
    while (fd.IsValid() && result != 0 && errno == EINTR) {
        if (between) {
            between();
        }
        result = flock(fd.Get(), LOCK_EX);
    }
    if (result != 0) {
        quivra::Fail({kUnit, __LINE__}, "flock(fd.Get(), LOCK_EX) != 0",
                     Error(Error::kLockFailed,
                           "Cannot lock " + path + ": " + quivra::SystemErrorText(errno)));
    }
    return fd;
}

/// What stops a whole share is told before its documents look gone.
void CheckIndexable(const quivra::sdk::SDKShare& share, const std::string& name) {
    if (!share.CanBeIndexed()) {
        throw Error(Error::kPathNotIndexable,
                    "The share is locked, read-only or excluded from indexing: " + name);
    }
}

bool IsSpaceShort(const std::string& share) {
    try {
        return !quivra::sdk::SDKShare(share).IsSpaceEnough();
    } catch (const Error&) {
        return false;  // the share has gone, which is another matter
    }
}

}  // namespace

ShareWorker::ShareWorker(std::string share) : share_(std::move(share)), state_(share_) {}

PassResult ShareWorker::RunPass(const std::function<void()>& between) {
    const quivra::base::UniqueFd lock = LockShare(share_, between);
    try {
        PassResult result = RunLocked(between);
        space_notified_ = false;
        state_.SetLastError("");
        if (result.had_work) {
            state_.SetLastPass(time(nullptr));
        }
        state_.Set(StateFile::State::kIdle);
        return result;
    } catch (const Stopped&) {
        throw;
    } catch (const std::exception& error) {
        if (!space_notified_ && IsSpaceShort(share_)) {
            space_notified_ = true;
            quivra::fileindex::SendKOSNotify();
        }
        state_.SetLastError(error.what());
        state_.Set(StateFile::State::kWaiting);
        throw;
    }
}

PassResult ShareWorker::RunLocked(const std::function<void()>& between) {
    const quivra::sdk::SDKShare share(share_);
    const std::unique_ptr<Scope> scope = LoadScope();
    CheckIndexable(share, share_);
    ElasticIndex index(share_);
    Pass pass(share.GetQueuePath(), share.GetPath(), index, *scope, [&](const PassState& state) {
        if (between) {
            between();
        }
        state_.SetProgress(state);
    });
    PassResult result = pass.Run();
    // Settings that changed meanwhile may have been left to a reindex of this very pass.
    if (result.had_work &&
        LoadScope()->Describe(share.GetPath()) != scope->Describe(share.GetPath())) {
        QueueReindex(share_);
    }
    return result;
}

}  // namespace fileindexd
