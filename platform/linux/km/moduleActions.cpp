// SPDX-License-Identifier: Apache-2.0
// Inserting and removing kernel modules.
#include "km/moduleActions.h"

#include "common/log.h"
#include "km/kmodLibrary.h"

#include <algorithm>
#include <fcntl.h>
#include <memory>

namespace veld {
namespace {

using Context = std::unique_ptr<kmod_ctx, decltype(&::kmod_unref)>;
using ModuleList = std::unique_ptr<kmod_list, decltype(&::kmod_module_unref_list)>;
using Module = std::unique_ptr<kmod_module, decltype(&::kmod_module_unref)>;

void logFromLibrary(void *, int priority, const char *, int, const char *, const char *format, va_list arguments) {
    char *message = nullptr;
    if (vasprintf(&message, format, arguments) < 0)
        return;
    message[strcspn(message, "\n")] = '\0';
    VELD_LOG(priority, "libkmod: %s", message);
    free(message);
}

// The modules of one kernel, for one owner.
class Modules {
public:
    // Not usable, with the reason logged, when the library is not.
    Modules(const char *ownerName, const char *directory)
        : owner(ownerName), library(kmodLibrary()),
          context(library != nullptr ? library->kmod_new(directory, nullptr) : nullptr, unref()) {
        if (context != nullptr)
            library->kmod_set_log_fn(context.get(), logFromLibrary, nullptr);
        else if (library != nullptr)
            VELD_LOG(LOG_ERR, "kernel modules for %s: libkmod: %s", owner, errorText(errno).c_str());
    }

    bool isUsable() const { return context != nullptr; }

    bool insert(const std::string &name) const {
        if (isPresent(name))
            return true;
        const ModuleList modules = lookUp(name);
        if (modules == nullptr) {
            VELD_LOG(LOG_WARNING,
                     "kernel module %s for %s: not known to the running kernel, which may have it compiled in",
                     name.c_str(), owner);
            return true;
        }
        for (kmod_list *item = modules.get(); item != nullptr; item = library->kmod_list_next(modules.get(), item)) {
            const Module module = owned(library->kmod_module_get_module(item));
            // Loads what it depends on first; what is loaded already is success.
            const int result =
                library->kmod_module_probe_insert_module(module.get(), 0, nullptr, nullptr, nullptr, nullptr);
            if (result < 0 && result != -EEXIST) {
                VELD_LOG(LOG_ERR, "kernel module %s for %s: cannot be loaded: %s",
                         library->kmod_module_get_name(module.get()), owner, errorText(-result).c_str());
                return false;
            }
        }
        return true;
    }

    bool remove(const std::string &name) const {
        const Module module = byName(name);
        if (module == nullptr || library->kmod_module_get_initstate(module.get()) != KMOD_MODULE_LIVE ||
            library->kmod_module_get_refcnt(module.get()) > 0)
            return true;
        // KMOD_REMOVE_NOWAIT: a module that comes into use meanwhile is told as such.
        const int result = library->kmod_module_remove_module(module.get(), KMOD_REMOVE_NOWAIT);
        if (result < 0 && result != -ENOENT && result != -EWOULDBLOCK && result != -EBUSY) {
            VELD_LOG(LOG_ERR, "kernel module %s for %s: cannot be removed: %s", name.c_str(), owner,
                     errorText(-result).c_str());
            return false;
        }
        return true;
    }

private:
    const char *owner;
    const KmodLibrary *library;
    Context context;

    decltype(&::kmod_unref) unref() const { return library != nullptr ? library->kmod_unref : nullptr; }
    Module owned(kmod_module *module) const { return {module, library->kmod_module_unref}; }

    Module byName(const std::string &name) const {
        kmod_module *module = nullptr;
        return owned(library->kmod_module_new_from_name(context.get(), name.c_str(), &module) < 0 ? nullptr : module);
    }

    // The modules that the running kernel has under that name or alias; empty when it knows none, also when there is
    // no module directory at all (containers).
    ModuleList lookUp(const std::string &name) const {
        kmod_list *list = nullptr;
        if (library->kmod_module_new_from_lookup(context.get(), name.c_str(), &list) < 0) {
            library->kmod_module_unref_list(list);
            list = nullptr;
        }
        return {list, library->kmod_module_unref_list};
    }

    bool isPresent(const std::string &name) const {
        const Module module = byName(name);
        const int state = module != nullptr ? library->kmod_module_get_initstate(module.get()) : -ENOENT;
        return state == KMOD_MODULE_BUILTIN || state == KMOD_MODULE_LIVE;
    }
};

bool forEachModule(const char *owner, const std::vector<std::string> &fileNames, const char *directory,
                   bool (Modules::*action)(const std::string &) const) {
    const Modules modules(owner, directory);
    return modules.isUsable() && std::all_of(fileNames.begin(), fileNames.end(), [&](const std::string &fileName) {
               const std::string name = moduleName(fileName);
               return name.empty() || (modules.*action)(name);
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
    return forEachModule(owner, fileNames, directory, &Modules::insert);
}

bool removeModules(const char *owner, const std::vector<std::string> &fileNames, const char *directory) {
    return forEachModule(owner, fileNames, directory, &Modules::remove);
}

}  // namespace veld
