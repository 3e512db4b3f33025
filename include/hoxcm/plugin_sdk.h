/* The C interface between the shared-object plugin runner and a plugin.
 *
 * A plugin is a shared object that exports one function,
 * hoxcm_plugin_describe(), returning a static table: the interface version
 * it was built against and one entry point per kind of run. Every entry
 * point takes the request document as JSON text (docs/plugin-protocol.md)
 * and the host root ("/" on a real host), and returns the result document
 * as JSON text allocated by the plugin, which the runner hands back to the
 * plugin's free_result. Returning NULL is a failure of the run.
 *
 * The runner refuses a table whose abi_version differs from
 * HOXCM_PLUGIN_ABI_VERSION. Entry points are called once per process, on
 * the runner's only thread; they must not throw C++ exceptions across this
 * interface (the runner treats an escaping exception as a failure). */
#ifndef HOXCM_PLUGIN_SDK_H_
#define HOXCM_PLUGIN_SDK_H_

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define HOXCM_PLUGIN_ABI_VERSION 1u
#define HOXCM_PLUGIN_DESCRIBE_SYMBOL "hoxcm_plugin_describe"

/* request_json: the whole request; host_root: the root below which every
 * host path lies. Result formats per operation: docs/plugin-protocol.md. */
typedef char* (*hoxcm_plugin_entry)(const char* request_json, const char* host_root);

typedef struct hoxcm_plugin_table {
  uint32_t abi_version;         /* HOXCM_PLUGIN_ABI_VERSION */
  const char* name;             /* for logs */
  hoxcm_plugin_entry apply;     /* "APPLY"; NULL when not supported */
  hoxcm_plugin_entry impact;    /* "IMPACT" */
  hoxcm_plugin_entry validate;  /* "VALIDATE" */
  void (*free_result)(char* result);
} hoxcm_plugin_table;

typedef const hoxcm_plugin_table* (*hoxcm_plugin_describe_fn)(void);

/* Exported by every plugin. */
#if defined(__GNUC__)
__attribute__((visibility("default")))
#endif
const hoxcm_plugin_table* hoxcm_plugin_describe(void);

#ifdef __cplusplus
}
#endif

#endif /* HOXCM_PLUGIN_SDK_H_ */
