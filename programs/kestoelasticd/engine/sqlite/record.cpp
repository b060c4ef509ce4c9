#include "programs/kestoelasticd/engine/sqlite/record.h"

#include <zstd.h>

#include <cstring>
#include <memory>
#include <new>

#include "programs/kestoelasticd/engine/engine.h"

namespace elasticd::engine::sqlite {
namespace {

/// On disk.
enum Tag : char { kFalse, kTrue, kInt, kDouble, kText, kName, kComposite };

constexpr int kCompressionLevel = 1;
constexpr unsigned long long kMaxText = 1ULL << 30;

class Encoder {
  public:
    explicit Encoder(std::string_view name) : name_(name) {}

    void Add(unsigned int field, const Value& value) {
        Number(field);
        if (const auto* flag = std::get_if<bool>(&value)) {
            out += *flag ? kTrue : kFalse;
        } else if (const auto* whole = std::get_if<std::int64_t>(&value)) {
            Int(*whole);
        } else if (const auto* real = std::get_if<double>(&value)) {
            out += kDouble;
            out.append(reinterpret_cast<const char*>(real), sizeof(*real));
        } else if (const auto* text = std::get_if<std::string>(&value)) {
            out += *text == name_ ? kName : kText;
            if (*text != name_) {
                Text(*text);
            }
        } else {
            const auto& composite = std::get<Composite>(value);
            out += kComposite;
            Text(composite.source);
            Number(composite.texts.size());
            for (const std::string& part : composite.texts) {
                Text(part);
            }
        }
    }

    std::string out;

  private:
    void Number(std::uint64_t number) {
        for (; number >= 0x80; number >>= 7) {
            out += static_cast<char>(0x80 | (number & 0x7f));
        }
        out += static_cast<char>(number);
    }

    void Int(std::int64_t number) {
        out += kInt;
        // Unsigned: a difference may overflow, and comes back all the same.
        const std::uint64_t step = static_cast<std::uint64_t>(number) - last_;
        last_ = static_cast<std::uint64_t>(number);
        Number((step << 1) ^ (0 - (step >> 63)));
    }

    void Text(std::string_view text) {
        Number(text.size());
        out += text;
    }

    const std::string_view name_;
    std::uint64_t last_ = 0;
};

class Decoder {
  public:
    Decoder(std::string_view in, std::string_view name) : in_(in), name_(name) {}

    Record Run() {
        Record record;
        while (!in_.empty()) {
            const auto field = static_cast<unsigned int>(Number());
            record.emplace_back(field, Next());
        }
        return record;
    }

  private:
    std::string_view Take(std::size_t size) {
        if (size > in_.size()) {
            throw Damaged("a document's record is cut off");
        }
        const std::string_view taken = in_.substr(0, size);
        in_.remove_prefix(size);
        return taken;
    }

    std::uint64_t Number() {
        std::uint64_t number = 0;
        for (unsigned int shift = 0; shift < 64; shift += 7) {
            const auto byte = static_cast<unsigned char>(Take(1)[0]);
            number |= static_cast<std::uint64_t>(byte & 0x7f) << shift;
            if (byte < 0x80) {
                return number;
            }
        }
        throw Damaged("a document's record holds an endless number");
    }

    std::string Text() { return std::string(Take(Number())); }

    Value Next() {
        switch (Take(1)[0]) {
            case kFalse:
                return false;
            case kTrue:
                return true;
            case kInt: {
                const std::uint64_t step = Number();
                last_ += (step >> 1) ^ (0 - (step & 1));
                return static_cast<std::int64_t>(last_);
            }
            case kDouble: {
                double real = 0;
                std::memcpy(&real, Take(sizeof(real)).data(), sizeof(real));
                return real;
            }
            case kText:
                return Text();
            case kName:
                return std::string(name_);
            case kComposite: {
                Composite composite{Text(), {}};
                for (std::uint64_t left = Number(); left > 0; --left) {
                    composite.texts.push_back(Text());
                }
                return composite;
            }
            default:
                throw Damaged("a document's record holds an unknown kind of value");
        }
    }

    std::string_view in_;
    const std::string_view name_;
    std::uint64_t last_ = 0;
};

}  // namespace

std::string EncodeRecord(const Record& record, std::string_view name) {
    Encoder encoder(name);
    for (const auto& [field, value] : record) {
        encoder.Add(field, value);
    }
    return std::move(encoder.out);
}

Record DecodeRecord(std::string_view encoded, std::string_view name) {
    return Decoder(encoded, name).Run();
}

std::string PackText(std::string_view text) {
    // Making the context costs more than compressing a small text.
    static thread_local const std::unique_ptr<ZSTD_CCtx, std::size_t (*)(ZSTD_CCtx*)> context(
        ZSTD_createCCtx(), ZSTD_freeCCtx);
    std::string packed(ZSTD_compressBound(text.size()), '\0');
    const std::size_t size = ZSTD_compressCCtx(context.get(), packed.data(), packed.size(),
                                               text.data(), text.size(), kCompressionLevel);
    if (ZSTD_isError(size) != 0) {
        throw std::bad_alloc();
    }
    packed.resize(size);
    return packed;
}

std::string UnpackText(std::string_view packed) {
    const unsigned long long size = ZSTD_getFrameContentSize(packed.data(), packed.size());
    if (size > kMaxText) {  // the values for "unknown" and "error" are above it, too
        throw Damaged("a text's frame is damaged");
    }
    std::string text(size, '\0');
    const std::size_t got = ZSTD_decompress(text.data(), text.size(), packed.data(), packed.size());
    if (got != text.size()) {
        throw Damaged("a text is damaged");
    }
    return text;
}

}  // namespace elasticd::engine::sqlite
