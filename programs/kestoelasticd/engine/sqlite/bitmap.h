#pragma once

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace elasticd::engine::sqlite {

/// A set of documents by their numbers, which are small: a million take 125 kB.
class Bitmap {
  public:
    void Set(std::int64_t id) {
        const auto word = static_cast<std::size_t>(id) / 64;
        if (word >= words_.size()) {
            words_.resize(word + 1 + word / 4);
        }
        words_[word] |= std::uint64_t{1} << (id % 64);
    }
    bool Has(std::int64_t id) const {
        const auto word = static_cast<std::size_t>(id) / 64;
        return word < words_.size() && (words_[word] >> (id % 64) & 1) != 0;
    }
    void Clear(std::int64_t id) {
        if (Has(id)) {
            words_[static_cast<std::size_t>(id) / 64] &= ~(std::uint64_t{1} << (id % 64));
        }
    }
    std::size_t Count() const {
        std::size_t count = 0;
        for (const std::uint64_t word : words_) {
            count += static_cast<std::size_t>(std::popcount(word));
        }
        return count;
    }

    void And(const Bitmap& other) {
        words_.resize(std::min(words_.size(), other.words_.size()));
        for (std::size_t i = 0; i < words_.size(); ++i) {
            words_[i] &= other.words_[i];
        }
    }
    void Or(const Bitmap& other) {
        words_.resize(std::max(words_.size(), other.words_.size()));
        for (std::size_t i = 0; i < other.words_.size(); ++i) {
            words_[i] |= other.words_[i];
        }
    }
    void Remove(const Bitmap& other) {
        for (std::size_t i = 0; i < words_.size() && i < other.words_.size(); ++i) {
            words_[i] &= ~other.words_[i];
        }
    }

    /// Calls `take` with each number, from the lowest on.
    template <typename Take>
    void ForEach(Take&& take) const {
        for (std::size_t i = 0; i < words_.size(); ++i) {
            for (std::uint64_t rest = words_[i]; rest != 0; rest &= rest - 1) {
                take(static_cast<std::int64_t>(i * 64 +
                                               static_cast<std::size_t>(std::countr_zero(rest))));
            }
        }
    }

  private:
    std::vector<std::uint64_t> words_;
};

}  // namespace elasticd::engine::sqlite
