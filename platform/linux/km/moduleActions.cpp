// SPDX-License-Identifier: Apache-2.0
// Inserting and removing kernel modules.
#include "km/moduleActions.h"

#include "common/log.h"

#include <algorithm>
#include <fcntl.h>
#include <libkmod.h>
#include <memory>

namespace veld {
namespace {

using Context = std::unique_ptr<kmod_ctx, kmod_ctx *(*)(kmod_ctx *)>;
using ModuleList = std::unique_ptr<kmod_list, int (*)(kmod_list *)>;
using Module = std::unique_ptr<kmod_module, kmod_module *(*)(kmod_module *)>;

void logFromLibrary(void *, int priority, const char *, int, const char *, const char *format, va_list arguments) {
    char *message = nullptr;
    if (vasprintf(&message, format, arguments) < 0)
        return;
    message[strcspn(message, "\n")] = '\0';
    VELD_LOG(priority, "libkmod: %s", message);
    free(message);
}

// Empty, with the reason logged, when the library cannot be used.
Context openContext(const char *owner, const char *directory) {
    Context context(kmod_new(directory, nullptr), kmod_unref);
    if (context != nullptr)
        kmod_set_log_fn(context.get(), logFromLibrary, nullptr);
    else
        VELD_LOG(LOG_ERR, "kernel modules for %s: libkmod: %s", owner, errorText(errno).c_str());
    return context;
}

// The modules that the running kernel has under that name or alias; empty when it knows none, also when there is no
// module directory at all (containers).
ModuleList lookUp(kmod_ctx *context, const std::string &name) {
    kmod_list *list = nullptr;
    if (kmod_module_new_from_lookup(context, name.c_str(), &list) < 0) {
        kmod_module_unref_list(list);
        list = nullptr;
    }
    return {list, kmod_module_unref_list};
}

bool isPresent(kmod_ctx *context, const std::string &name) {
    kmod_module *module = nullptr;
    if (kmod_module_new_from_name(context, name.c_str(), &module) < 0)
        return false;
    const Module owned(module, kmod_module_unref);
    const int state = kmod_module_get_initstate(module);
    return state == KMOD_MODULE_BUILTIN || state == KMOD_MODULE_LIVE;
}

bool insertModule(kmod_ctx *context, const char *owner, const std::string &name) {
    if (isPresent(context, name))
        return true;
    const ModuleList modules = lookUp(context, name);
    if (modules == nullptr) {
        VELD_LOG(LOG_WARNING, "kernel module %s for %s: not known to the running kernel, which may have it compiled in",
                 name.c_str(), owner);
        return true;
    }
    kmod_list *item = nullptr;
    kmod_list_foreach(item, modules.get()) {
        const Module module(kmod_module_get_module(item), kmod_module_unref);
        // Loads what it depends on first; what is loaded already is success.
        const int result = kmod_module_probe_insert_module(module.get(), 0, nullptr, nullptr, nullptr, nullptr);
        if (result < 0 && result != -EEXIST) {
            VELD_LOG(LOG_ERR, "kernel module %s for %s: cannot be loaded: %s", kmod_module_get_name(module.get()),
                     owner, errorText(-result).c_str());
            return false;
        }
    }
    return true;
}

bool removeModule(kmod_ctx *context, const char *owner, const std::string &name) {
    kmod_module *found = nullptr;
    if (kmod_module_new_from_name(context, name.c_str(), &found) < 0)
        return true;
    const Module module(found, kmod_module_unref);
    if (kmod_module_get_initstate(found) != KMOD_MODULE_LIVE || kmod_module_get_refcnt(found) > 0)
        return true;
    // O_NONBLOCK: a module that comes into use meanwhile is told as such.
    const int result = kmod_module_remove_module(found, KMOD_REMOVE_NOWAIT);
    if (result < 0 && result != -ENOENT && result != -EWOULDBLOCK && result != -EBUSY) {
        VELD_LOG(LOG_ERR, "kernel module %s for %s: cannot be removed: %s", name.c_str(), owner,
                 errorText(-result).c_str());
        return false;
    }
    return true;
}

template <typename Action>
bool forEachModule(const char *owner, const std::vector<std::string> &fileNames, const char *directory, Action action) {
    const Context context = openContext(owner, directory);
    if (context == nullptr)
        return false;
    return std::all_of(fileNames.begin(), fileNames.end(), [&](const std::string &fileName) {
        const std::string name = moduleName(fileName);
        return name.empty() || action(context.get(), owner, name);
    });
}

}  // namespace

std::string moduleName(std::string_view fileName) {
    fileName.remove_prefix(fileName.rfind('/') + 1);
    std::string name(fileName.substr(0, fileName.find(".ko")));
    std::replace(name.begin(), name.end(), '-', '_');
    return name;
}

bool insertModules(const char *owner, const std::vector<std::string> &fileNames, const char *directory) {
    return forEachModule(owner, fileNames, directory, insertModule);
}

bool removeModules(const char *owner, const std::vector<std::string> &fileNames, const char *directory) {
    return forEachModule(owner, fileNames, directory, removeModule);
}

}  // namespace veld
