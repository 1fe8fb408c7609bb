/* SPDX-License-Identifier: Apache-2.0 */
/* libveldsdk: directories and plug-in hooks. */
#ifndef VELD_SDK_H
#define VELD_SDK_H

#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/* Creates the directory with its parents; one that exists is success. 0, or -1 with errno. */
int VELDFSMkdirP(const char *path, mode_t mode);

typedef struct VLIBPlugin *VLIBPLUGIN_HANDLE;

/* Codes of VLIBPluginAction(). */
#define VLIB_PLUGIN_PRE 4
#define VLIB_PLUGIN_POST 5

/* Opens a handle for a hook, for example ("net", "net/firewall_enable"). 0, or negative with *handle NULL. */
int VLIBPluginSDKInit(const char *category, const char *hook, VLIBPLUGIN_HANDLE *handle);
/* Sets an argument that the hook's programs receive. 0, or negative. */
int VLIBPluginSetArg(VLIBPLUGIN_HANDLE handle, const char *key, const char *value);
/* Runs the hook's programs and waits for them. 0, or negative when one failed. */
int VLIBPluginAction(int code, VLIBPLUGIN_HANDLE handle);
/* Closes the handle; NULL is allowed. */
void VLIBPluginExit(VLIBPLUGIN_HANDLE handle);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
