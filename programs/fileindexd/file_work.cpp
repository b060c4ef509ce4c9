#include "programs/fileindexd/file_work.h"

#include <optional>
#include <system_error>
#include <unordered_set>
#include <utility>

#include "base/path.h"
#include "programs/fileindexd/failures.h"

namespace fileindexd {

using quivra::base::IsAtOrBelow;

namespace {

// Between two commits. Names are not begun against the clock, so few at a time.
constexpr std::size_t kFiles = 500;
constexpr std::size_t kNames = 200;

}  // namespace

/// Files of a pass that had too many. False when none is waiting for its name.
bool FileWork::Name() {
    const std::vector<Backlog::File> files = backlog_.UnnamedFiles(kNames);
    std::vector<Extraction> jobs;
    std::vector<std::string> paths;
    for (const Backlog::File& file : files) {
        Extraction job;
        if (IsToBeExtracted(file, job)) {
            paths.push_back(job.path);
            jobs.push_back(std::move(job));
        }
    }
    std::unordered_set<std::string> known;
    for (Document& document : index_.Find(paths)) {
        known.insert(std::move(document.path));
    }
    std::vector<std::string> named;
    for (const Extraction& job : jobs) {
        if (!job.need_meta || !known.contains(job.path)) {
            batch_.Upsert(job.path, false, true);
        }
        (job.need_meta ? named : done_).push_back(job.path);
    }
    batch_.Commit();
    if (!files.empty()) {
        backlog_.NoteNamed(named, std::exchange(done_, {}), std::exchange(trees_, {}));
        backlog_.NoteFiles({}, std::exchange(failures_, {}), {}, now_);
    }
    return !files.empty();
}

/// False when no file is due.
bool FileWork::Extract() {
    const std::vector<Backlog::File> files = backlog_.DueFiles(now_, kFiles);
    if (files.empty()) {
        return false;
    }
    std::vector<Extraction> jobs;
    std::vector<const Backlog::File*> of_jobs;
    for (const Backlog::File& file : files) {
        Extraction job;
        if (IsToBeExtracted(file, job)) {
            jobs.push_back(std::move(job));
            of_jobs.push_back(&file);
        }
    }
    fileindexd::Extract(index_, jobs, until_);
    for (std::size_t i = 0; i < jobs.size(); ++i) {
        TakeOutcome(jobs[i], *of_jobs[i]);
    }
    batch_.Commit();
    std::vector<std::string> extracted;
    for (const Extraction& job : jobs) {
        if (job.outcome == Extraction::Outcome::kDone && job.need_meta) {
            extracted.push_back(job.path);
        }
    }
    // The platform says in the document why it has no content; the command itself succeeded.
    std::vector<Problem> unread = ReadProblems(index_, extracted);
    std::unordered_set<std::string> failed;
    for (const Problem& problem : unread) {
        failed.insert(problem.path);
    }
    std::erase_if(done_, [&](const std::string& path) { return failed.contains(path); });
    unread.insert(unread.end(), failures_.begin(), failures_.end());
    backlog_.NoteFiles(std::exchange(done_, {}), unread, std::exchange(trees_, {}), now_);
    failures_.clear();
    return true;
}

/// What stands at the path decides.
bool FileWork::IsToBeExtracted(const Backlog::File& file, Extraction& job) {
    std::optional<Attributes> there;
    batch_.Announce(file.path);
    if (!IsAtOrBelow(file.path, tree_.Root())) {
        done_.push_back(file.path);
        return false;
    }
    try {
        there = tree_.Look(file.path);
    } catch (const std::system_error& error) {
        failures_.push_back({file.path, error.what(), true});
        return false;
    }
    // A directory that could not be read is tried again as a tree.
    if (there && there->is_dir) {
        trees_.push_back({0, file.path, {}});
    }
    if (!there || there->is_dir || !scope_.Covers(file.path, false)) {
        done_.push_back(file.path);  // whoever took it away sees to its documents
        return false;
    }
    job.path = file.path;
    job.need_meta = scope_.NeedsMeta(file.path);
    return true;
}

void FileWork::TakeOutcome(const Extraction& job, const Backlog::File& file) {
    switch (job.outcome) {
        case Extraction::Outcome::kNotTried:
            return;
        case Extraction::Outcome::kDone:
            batch_.NoteIndexed();
            done_.push_back(job.path);
            ++files_;
            bytes_ += static_cast<std::uint64_t>(file.size);
            return;
        case Extraction::Outcome::kRefused:
            batch_.Upsert(job.path, false, true);  // by its name, at least
            batch_.TakeProblems();                 // the reason is known
            failures_.push_back({job.path, job.reason, job.can_pass});
            return;
    }
}

}  // namespace fileindexd
