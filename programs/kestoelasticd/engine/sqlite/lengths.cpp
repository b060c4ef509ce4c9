#include "programs/kestoelasticd/engine/sqlite/lengths.h"

#include <algorithm>
#include <cmath>
#include <map>

#include "programs/kestoelasticd/engine/engine.h"
#include "programs/sqlite/statement.h"

namespace elasticd::engine::sqlite {
namespace {

constexpr double kStepsPerOctave = 8;

}  // namespace

std::uint8_t Lengths::Encode(std::size_t length) {
    const double step = 1 + kStepsPerOctave * std::log2(static_cast<double>(length) + 1);
    return static_cast<std::uint8_t>(std::min(step, 255.0));
}

double Lengths::Decode(std::uint8_t length) {
    return length == 0 ? 0 : std::exp2((length - 1) / kStepsPerOctave) - 1;
}

void Lengths::Load(::sqlite::Database& database) {
    View view;
    ::sqlite::Statement read(database, "SELECT page, bytes FROM lengths ORDER BY page");
    while (read.Step()) {
        const std::string_view bytes = read.Bytes(1);
        if (read.Int(0) != static_cast<std::int64_t>(view.pages_.size()) || bytes.size() != kPage) {
            throw Damaged("the table of lengths is damaged");
        }
        auto page = std::make_shared<View::Page>();
        for (std::size_t i = 0; i < kPage; ++i) {
            (*page)[i].store(static_cast<std::uint8_t>(bytes[i]), std::memory_order_relaxed);
        }
        view.pages_.push_back(std::move(page));
    }
    const std::lock_guard lock(mutex_);
    view_ = std::move(view);
    pending_.clear();
}

void Lengths::Save(::sqlite::Database& database) {
    std::map<std::size_t, std::string> pages;
    for (const auto& [id, length] : pending_) {
        const auto at = static_cast<std::size_t>(id);
        std::string& bytes = pages[at / kPage];
        if (bytes.empty()) {
            bytes.resize(kPage);
            for (std::size_t i = 0; i < kPage; ++i) {
                const auto neighbour = static_cast<std::int64_t>(at / kPage * kPage + i);
                bytes[i] = static_cast<char>(view_.Of(neighbour));
            }
        }
        bytes[at % kPage] = static_cast<char>(length);
    }
    if (pages.empty()) {
        return;
    }
    // No gap: a page that holds no document yet is written, too.
    for (std::size_t page = view_.pages_.size(); page < pages.rbegin()->first; ++page) {
        pages.try_emplace(page, std::string(kPage, '\0'));
    }
    ::sqlite::Statement write(database, "INSERT OR REPLACE INTO lengths VALUES(?, ?)");
    for (const auto& [page, bytes] : pages) {
        write.Bind(1, static_cast<std::int64_t>(page)).BindBlob(2, bytes).Run();
    }
}

void Lengths::Publish() {
    const std::lock_guard lock(mutex_);
    for (const auto& [id, length] : pending_) {
        const auto at = static_cast<std::size_t>(id);
        while (view_.pages_.size() <= at / kPage) {
            view_.pages_.push_back(std::make_shared<View::Page>());
        }
        (*view_.pages_[at / kPage])[at % kPage].store(length, std::memory_order_relaxed);
    }
    pending_.clear();
}

Lengths::View Lengths::GetView() const {
    const std::lock_guard lock(mutex_);
    return view_;
}

}  // namespace elasticd::engine::sqlite
