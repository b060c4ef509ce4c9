#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "programs/sqlite/database.h"

namespace elasticd::engine::sqlite {

/// How long each document is, in memory: a byte each, in steps of an eighth of an octave. Ranking
/// needs it for every match, and a row read for each match is what makes FTS5's own ranking slow
/// (2 s against 0.2 s for a word in most of a million documents). One writer, many readers.
class Lengths {
  public:
    /// A length as it is kept; 0 stands for no document.
    static std::uint8_t Encode(std::size_t length);
    static double Decode(std::uint8_t length);

    void Load(::sqlite::Database& database);

    /// The writer's: counts with the next Save only.
    void Put(std::int64_t id, std::uint8_t length) { pending_[id] = length; }
    /// The length as the writer has put it last.
    std::uint8_t Of(std::int64_t id) const {
        const auto pending = pending_.find(id);
        return pending == pending_.end() ? view_.Of(id) : pending->second;
    }
    /// Writes the pages that changed. Their lengths are readers' after Publish.
    void Save(::sqlite::Database& database);
    void Publish();
    void Drop() { pending_.clear(); }

    /// All lengths as they are now. Never changed afterwards beyond single bytes of documents that
    /// were changed since: a rank may be of tomorrow, never of nothing.
    class View {
      public:
        std::uint8_t Of(std::int64_t id) const {
            const auto at = static_cast<std::size_t>(id);
            return at / kPage < pages_.size()
                       ? (*pages_[at / kPage])[at % kPage].load(std::memory_order_relaxed)
                       : std::uint8_t{0};
        }

      private:
        friend class Lengths;
        static constexpr std::size_t kPage = 4000;  ///< on disk: a row fits into a page
        using Page = std::array<std::atomic<std::uint8_t>, kPage>;
        std::vector<std::shared_ptr<Page>> pages_;
    };
    View GetView() const;

  private:
    static constexpr std::size_t kPage = View::kPage;

    mutable std::mutex mutex_;  ///< for pages_ in view_, not for their bytes
    View view_;
    std::unordered_map<std::int64_t, std::uint8_t> pending_;
};

}  // namespace elasticd::engine::sqlite
