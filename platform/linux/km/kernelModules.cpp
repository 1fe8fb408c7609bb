// SPDX-License-Identifier: Apache-2.0
// VLIBIptablesModInsert(), VLIBIptablesModRemove().
#include "veld/km.h"

#include "common/log.h"
#include "km/moduleActions.h"

namespace {

int forList(const char *owner, const VLIBCSZLIST *list,
            bool (*action)(const char *, const std::vector<std::string> &, const char *)) {
    if (list == nullptr) {
        VELD_LOG(LOG_ERR, "bad parameter: no list of modules");
        VELD_SET_ERROR(veld::kBadParameter);
        return -1;
    }
    std::vector<std::string> names;
    for (int i = 0; i < list->nItem; ++i) {
        if (const char *name = VLIBCSzListGet(list, i); name != nullptr)
            names.emplace_back(name);
    }
    if (action(owner != nullptr ? owner : "(nobody)", names, nullptr))
        return 0;
    VELD_SET_ERROR(veld::kInternalError);
    return -1;
}

}  // namespace

int VLIBIptablesModInsert(const char *owner, const VLIBCSZLIST *list) {
    return veld::guarded(__func__, -1, [&] { return forList(owner, list, veld::insertModules); });
}

int VLIBIptablesModRemove(const char *owner, const VLIBCSZLIST *list) {
    return veld::guarded(__func__, -1, [&] { return forList(owner, list, veld::removeModules); });
}
