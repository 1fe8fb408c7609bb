// SPDX-License-Identifier: Apache-2.0
// libkmod, opened when a module is first asked for: it brings a whole cryptographic library, whose loading would
// double the start-up time of every program that links the firewall.
#pragma once

#include <libkmod.h>

namespace veld {

// The functions of libkmod that are used, each under its own name.
struct KmodLibrary {
#define VELD_KMOD_FUNCTIONS(FUNCTION)                                                                                  \
    FUNCTION(kmod_new)                                                                                                 \
    FUNCTION(kmod_unref)                                                                                               \
    FUNCTION(kmod_set_log_fn)                                                                                          \
    FUNCTION(kmod_list_next)                                                                                           \
    FUNCTION(kmod_module_new_from_lookup)                                                                              \
    FUNCTION(kmod_module_new_from_name)                                                                                \
    FUNCTION(kmod_module_unref_list)                                                                                   \
    FUNCTION(kmod_module_unref)                                                                                        \
    FUNCTION(kmod_module_get_initstate)                                                                                \
    FUNCTION(kmod_module_get_module)                                                                                   \
    FUNCTION(kmod_module_get_name)                                                                                     \
    FUNCTION(kmod_module_get_refcnt)                                                                                   \
    FUNCTION(kmod_module_probe_insert_module)                                                                          \
    FUNCTION(kmod_module_remove_module)
// NOLINTNEXTLINE(bugprone-macro-parentheses): a name cannot be declared in parentheses
#define VELD_KMOD_MEMBER(function) decltype(&::function) function = nullptr;
    VELD_KMOD_FUNCTIONS(VELD_KMOD_MEMBER)
#undef VELD_KMOD_MEMBER
};

// The library, open until the process ends; nullptr, with the reason logged, when it cannot be opened. A later call
// tries again. Any thread may call it.
const KmodLibrary *kmodLibrary();

}  // namespace veld
