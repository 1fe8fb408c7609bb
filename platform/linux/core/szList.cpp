// SPDX-License-Identifier: Apache-2.0
// Growable list of C strings.
#include "common/log.h"

#include <algorithm>
#include <climits>

PVLIBCSZLIST VLIBCSzListAlloc(int size) {
    auto *const list = size < 0 ? nullptr : static_cast<PVLIBCSZLIST>(calloc(1, sizeof(VLIBCSZLIST)));
    if (list != nullptr) {
        list->nCapacity = std::max(size, 1);
        list->items = static_cast<char **>(calloc(static_cast<std::size_t>(list->nCapacity), sizeof(char *)));
        if (list->items != nullptr)
            return list;
        free(list);
    }
    VELD_SET_ERROR(size < 0 ? veld::kBadParameter : veld::systemErrorCode(ENOMEM));
    return nullptr;
}

int VLIBCSzListPush(PVLIBCSZLIST *list, const char *item) {
    if (list == nullptr || *list == nullptr || item == nullptr) {
        VELD_SET_ERROR(veld::kBadParameter);
        return -1;
    }
    VLIBCSZLIST &target = **list;
    if (target.nItem == target.nCapacity) {
        const int capacity = target.nCapacity <= INT_MAX / 2 ? target.nCapacity * 2 : INT_MAX;
        void *const items = capacity > target.nItem
                                ? reallocarray(target.items, static_cast<std::size_t>(capacity), sizeof(char *))
                                : nullptr;
        if (items == nullptr) {
            VELD_SET_ERROR(veld::systemErrorCode(ENOMEM));
            return -1;
        }
        target.items = static_cast<char **>(items);
        target.nCapacity = capacity;
    }
    char *const copy = strdup(item);
    if (copy == nullptr) {
        VELD_SET_ERROR(veld::systemErrorCode(ENOMEM));
        return -1;
    }
    target.items[target.nItem++] = copy;
    return target.nItem;
}

const char *VLIBCSzListGet(const VLIBCSZLIST *list, int index) {
    return list != nullptr && index >= 0 && index < list->nItem ? list->items[index] : nullptr;
}

void VLIBCSzListFree(PVLIBCSZLIST list) {
    if (list == nullptr)
        return;
    for (int i = 0; i < list->nItem; ++i)
        free(list->items[i]);
    free(list->items);
    free(list);
}
