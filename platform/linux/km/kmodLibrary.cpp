// SPDX-License-Identifier: Apache-2.0
// Opening libkmod.
#include "km/kmodLibrary.h"

#include "common/log.h"

#include <dlfcn.h>
#include <mutex>

namespace veld {
namespace {

// The name with the version of the interface that the header was written for.
constexpr const char *kLibraryName = "libkmod.so.2";

template <typename Function> bool find(void *handle, const char *name, Function &function) {
    function = reinterpret_cast<Function>(dlsym(handle, name));
    return function != nullptr;
}

bool open(KmodLibrary &library) {
    void *const handle = dlopen(kLibraryName, RTLD_LAZY | RTLD_LOCAL);
    if (handle == nullptr)
        return false;
    bool isWhole = true;
#define VELD_KMOD_FIND(function) isWhole = find(handle, #function, library.function) && isWhole;
    VELD_KMOD_FUNCTIONS(VELD_KMOD_FIND)
#undef VELD_KMOD_FIND
    return isWhole;
}

}  // namespace

const KmodLibrary *kmodLibrary() {
    static std::mutex mutex;
    static KmodLibrary library;
    static bool isOpen = false;
    const std::lock_guard<std::mutex> guard(mutex);
    isOpen = isOpen || open(library);
    if (!isOpen) {
        const char *const reason = dlerror();
        VELD_LOG(LOG_ERR, "kernel modules: libkmod cannot be used: %s", reason != nullptr ? reason : kLibraryName);
    }
    return isOpen ? &library : nullptr;
}

}  // namespace veld
