#pragma once

#include <functional>

namespace elasticd {

/// Runs `action` and turns what the search engine throws into Error 1412 (no space), 1413 (the
/// files cannot be used) or 1415, and a lack of memory into 1400. Other errors pass.
template <typename Action>
auto TranslateEngineErrors(const Action& action) -> decltype(action());

/// Whether such an error tells that the engine failed, not that the request was refused.
bool IsEngineError(int code);

/// Throws the error for the exception that is being handled.
[[noreturn]] void RethrowTranslated();

template <typename Action>
auto TranslateEngineErrors(const Action& action) -> decltype(action()) {
    try {
        return action();
    } catch (...) {
        RethrowTranslated();
    }
}

}  // namespace elasticd
