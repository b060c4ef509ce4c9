#include "programs/fileindexd/extract.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <mutex>
#include <thread>

namespace fileindexd {

namespace {

using Clock = std::chrono::steady_clock;

/// More only wait for each other in the search daemon, which takes an index's changes one by one.
constexpr unsigned int kMostThreads = 4;

void ExtractOne(Index& index, Extraction& file) {
    try {
        index.Upsert(file.path, file.need_meta);
        file.outcome = Extraction::Outcome::kDone;
    } catch (const DocumentError& error) {
        file.outcome = Extraction::Outcome::kRefused;
        file.reason = error.what();
        file.can_pass = error.can_pass;
    }
}

class Crew {
  public:
    Crew(Index& index, std::vector<Extraction>& files, Clock::time_point until)
        : index_(index), files_(files), until_(until) {}

    void Work() {
        try {
            for (std::size_t i = next_++; i < files_.size(); i = next_++) {
                if (i > 0 && Clock::now() >= until_) {
                    return;
                }
                ExtractOne(index_, files_[i]);
            }
        } catch (...) {
            const std::lock_guard lock(mutex_);
            failure_ = std::current_exception();
            next_ = files_.size();  // the others come to rest after the file they are at
        }
    }

    void Finish() const {
        if (failure_) {
            std::rethrow_exception(failure_);
        }
    }

  private:
    Index& index_;
    std::vector<Extraction>& files_;
    const Clock::time_point until_;
    std::atomic<std::size_t> next_ = 0;
    std::mutex mutex_;
    std::exception_ptr failure_;
};

}  // namespace

void Extract(Index& index, std::vector<Extraction>& files, Clock::time_point until) {
    Crew crew(index, files, until);
    const auto wanted =
        static_cast<std::size_t>(std::clamp(std::thread::hardware_concurrency(), 2U, kMostThreads));
    {
        std::vector<std::jthread> others;
        for (std::size_t i = 1; i < std::min(wanted, files.size()); ++i) {
            others.emplace_back([&] { crew.Work(); });
        }
        crew.Work();
    }
    crew.Finish();
}

}  // namespace fileindexd
