#pragma once

/*
 * What the platform's power-log library exports, in plain C. The daemon looks for libvoltmark.so.1 where the dynamic
 * linker looks for libraries; without it, records go to the state directory's powerlog.jsonl.
 *
 * VMLogRegisteredEvent is called on any thread, several at a time, inside the daemon's sandbox, while a client waits:
 * return soon. What the pointers lead to is valid for the length of the call.
 */

#include <stddef.h> /* NOLINT(modernize-deprecated-headers): this header is C */
#include <stdint.h> /* NOLINT(modernize-deprecated-headers) */

#ifdef __cplusplus
extern "C" {
#endif

/* A string-keyed dictionary as one MessagePack map. */
typedef struct VMPowerLogRecord {
  const uint8_t* bytes;
  size_t length;
} VMPowerLogRecord;

/* `event`: the registered event's identifier; `sender`: a NUL-terminated name; `reserved`: null. */
void VMLogRegisteredEvent(int32_t event, const char* sender, const VMPowerLogRecord* record, const void* reserved);

#ifdef __cplusplus
}
#endif
