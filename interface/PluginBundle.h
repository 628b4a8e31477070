#pragma once

/*
 * The interface between the daemon and a plug-in, in plain C.
 *
 * A plug-in is a directory NAME.bundle that holds a shared library NAME.so. The library exports one object:
 *
 *     const OrvantaPluginBundle orvantaPluginBundle = {ORVANTA_PLUGIN_ABI_VERSION, findClass};
 *
 * The daemon asks it for a class by name, makes instances of the class, asks the class for an operation by name and
 * calls the operation on an instance. The library is loaded once per process and never unloaded. It runs inside the
 * daemon's sandbox: it may read and write what the daemon may.
 *
 * Diagnostics adaptor: the library Tamberline.bundle/Bundles/HQXPerformance.bundle/HQXPerformance.so below the plug-in
 * directory, its class "BriskAdaptor", the operation "sendMessageWithMethod:respCode:dict:". One instance is made for
 * each reporting session of a supported client type and gets every event of that session.
 *
 * Threads: calls on one instance come one at a time, from create() to destroy(), on any thread of the daemon; calls on
 * different instances may run at the same time. The session's client waits meanwhile: return soon. No exception may
 * leave a call.
 *
 * Pointers that the daemon passes are valid during the call. The classes and operations that the plug-in returns must
 * stay valid for as long as the process lives.
 */

#include <stddef.h> /* NOLINT(modernize-deprecated-headers): this header is C */
#include <stdint.h> /* NOLINT(modernize-deprecated-headers) */

#ifdef __cplusplus
extern "C" {
#endif

/* The version of everything below. A plug-in of another version is not used. */
#define ORVANTA_PLUGIN_ABI_VERSION 1U

/* The name of the exported object, as the daemon looks it up. */
#define ORVANTA_PLUGIN_SYMBOL "orvantaPluginBundle"

#if defined(__GNUC__)
#define ORVANTA_PLUGIN_EXPORT __attribute__((visibility("default")))
#else
#define ORVANTA_PLUGIN_EXPORT
#endif

/*
 * One event: its category, its type and its payload as one MessagePack map. An event without a payload passes a null
 * pointer and a length of 0; an empty payload is a map without entries (one byte, 0x80).
 */
typedef void (*OrvantaPluginOperation)(void* instance, uint16_t method, uint16_t respCode, const uint8_t* payload,
                                       size_t payloadLength);

typedef struct OrvantaPluginClass {
  /* A new instance, or null on failure: then nothing is called on it. */
  void* (*create)(void);
  /* Destroys an instance. May be null when there is nothing to do. */
  void (*destroy)(void* instance);
  /* The operation of that name, or null when the class does not have it. */
  OrvantaPluginOperation (*findOperation)(const char* name);
} OrvantaPluginClass;

typedef struct OrvantaPluginBundle {
  /* ORVANTA_PLUGIN_ABI_VERSION; first in every version. */
  uint32_t abiVersion;
  /* The class of that name, or null when the bundle does not have it. */
  const OrvantaPluginClass* (*findClass)(const char* name);
} OrvantaPluginBundle;

/* Defined by the plug-in. */
extern ORVANTA_PLUGIN_EXPORT const OrvantaPluginBundle orvantaPluginBundle;

#ifdef __cplusplus
}
#endif
