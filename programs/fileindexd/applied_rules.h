#pragma once

#include <string>

namespace fileindexd {

/// The rules (Scope::Describe) that the last complete pass over a share worked by, in a file beside
/// the queue. A pending reindex stands for changed settings too: the library queues none that it
/// covers. So a reindex under other rules than these has to extract again what looks unchanged. A
/// lost or torn file costs such an extraction.
class AppliedRules {
  public:
    explicit AppliedRules(std::string path) : path_(std::move(path)) {}

    bool AreEqualTo(const std::string& rules) const;

    /// Replaces the file. Throws Error 505.
    void Store(const std::string& rules) const;

  private:
    std::string path_;
};

}  // namespace fileindexd
