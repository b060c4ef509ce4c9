#include <kesto/error.h>
#include <kesto/string_list.h>

#include <algorithm>
#include <string>
#include <vector>

#include "platform/standalone/error_state.h"

struct KLIBCSzList {
    std::vector<std::string> texts;
};

KLIBCSzList* KLIBCSzListAlloc(int size) {
    auto* list = new KLIBCSzList;
    // A caller's guess must not cost memory that no machine has.
    list->texts.reserve(static_cast<std::size_t>(std::clamp(size, 0, 1 << 16)));
    return list;
}

void KLIBCSzListFree(KLIBCSzList* list) {
    delete list;
}

int KLIBCSzListPush(KLIBCSzList** list, const char* text) {
    if (list == nullptr || *list == nullptr || text == nullptr) {
        return kesto::SetError(KESTO_ERR_BAD_ARGUMENT);
    }
    (*list)->texts.emplace_back(text);
    return 0;
}

const char* KLIBCSzListGet(const KLIBCSzList* list, int position) {
    const auto index = static_cast<std::size_t>(position);  // a negative one is beyond every end
    return index < list->texts.size() ? list->texts[index].c_str() : nullptr;
}

int KLIBCSzListFind(const KLIBCSzList* list, const char* text) {
    const auto it = std::find(list->texts.begin(), list->texts.end(), text);
    return it == list->texts.end() ? kesto::SetError(KESTO_ERR_NOT_FOUND)
                                   : static_cast<int>(it - list->texts.begin());
}
