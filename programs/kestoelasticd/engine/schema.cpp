#include "programs/kestoelasticd/engine/schema.h"

#include <utility>

namespace elasticd::engine {

Schema::Schema(std::string id_field, FieldSettings otherwise,
               std::map<std::string, FieldSettings> listed)
    : id_field_(std::move(id_field)), default_(otherwise), listed_(std::move(listed)) {
    for (const auto& [field, settings] : listed_) {
        if (settings.required && field != id_field_) {
            required_.push_back(field);
        }
    }
}

const FieldSettings& Schema::Of(const std::string& field) const {
    const auto found = listed_.find(field);
    return found == listed_.end() ? default_ : found->second;
}

}  // namespace elasticd::engine
