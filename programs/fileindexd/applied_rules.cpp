#include "programs/fileindexd/applied_rules.h"

#include "common/json.h"
#include "common/log.h"

namespace fileindexd {

bool AppliedRules::AreEqualTo(const std::string& rules) const {
    Json::Value stored;
    return quivra::fromFile(stored, path_) && stored == Json::Value(rules);
}

void AppliedRules::Store(const std::string& rules) const {
    if (!AreEqualTo(rules) && !quivra::toFile(Json::Value(rules), path_)) {
        quivra::Fail({"applied_rules", __LINE__}, "!toFile(rules, path_)",
                     quivra::Error(quivra::Error::kSaveFailed, "Failed to save " + path_));
    }
}

}  // namespace fileindexd
