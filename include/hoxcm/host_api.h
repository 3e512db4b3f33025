// The single-item host API: read, set or delete the configuration of one
// item (component, group, key) without preparing a whole desired document.
// It is built on the same machinery as the whole-document operations of
// <hoxcm/operations.h>: the key's schema, the drift walk, Impact and the
// plugins' apply runs. docs/host-api.md describes every choice, with
// examples; the usual sequence for a change is
//
//   Document value;                                      // the new item
//   std::vector<ValidationErrorInfo> findings;
//   ValidateInput(c, g, k, text, value, findings);       // findings: stop
//   Document current, desired, staged;
//   GenerateSetDocuments(c, g, k, current, desired, staged, value);
//   ImpactResult impact = CheckImpact(desired, current, task);
//   if (!impact.compliant) SetConfig(current, desired, staged, impact, c, g, k, task);
//
// An item is a singleton's object or the whole array of a multi-instance
// key's instances. A change applies at once when it needs nothing (or
// maintenance mode, with the host in it) and is staged for the next boot
// when it needs a reboot; while a staged change waits (boot mode 4), every
// further change is refused with 2029 until the boot-time apply has run.
//
// Every operation runs on the caller's thread. SetConfig and DeleteConfig
// hold the host run lock from their checks to their last plugin run, so they
// never interleave with another apply (they wait for it, posting
// kApplyWaitingForHost; an abort ends the wait), and each leaves a record in
// the apply history (kind "set" or "delete"). Failures are thrown through
// ThrowException with the codes named below; a plugin's failure travels as
// code 2084 whose message carries the plugin's ErrorInfo (PluginErrorOf).
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <hoxcm/errors.h>
#include <hoxcm/export.h>
#include <hoxcm/json.h>
#include <hoxcm/operations.h>
#include <hoxcm/task.h>

namespace HoxConfigManager {

// The item's configuration as three JSON texts:
//   currentConfig  what the host has now, as the drift walk compares it (an
//                  object, or an array of instances that keep their
//                  "cs_generated_id"); "null" when the host has none;
//   defaultConfig  the configuration the key ships with; "null" without one;
//   userConfig     "true" when the host holds configuration for the item
//                  that differs from its default, else "false".
// Sensitive values are in clear: the caller masks what it shows.
// Throws ConfigManagerException 2180 (no schema store), 2001 (the store
// cannot be opened), 2181 (the item is not user configuration on this
// host), InvalidArgumentException 2021 (no schema for the key).
HOXCM_API void GetConfig(const std::string& component, const std::string& group, const std::string& key,
                         std::string& currentConfig, std::string& defaultConfig, std::string& userConfig);

// Checks `input`, the JSON text of a new item, and parses it into `value`.
// Refuses (InvalidArgumentException) an empty text (2023), malformed JSON
// (2080, with its line and column), an array for a singleton (2028), an
// object for a multi-instance key (2022), "DELETE_DEFAULT" as the item or an
// instance (2027), a key without schema (2021); an instance that a solution
// created (2181, ConfigManagerException). Everything else the key's schema
// says about the value lands in `findings`, one entry per field
// ("/component/group/key/0/mtu"), as Validate reports them, plus a repeated
// identity among the instances. Nothing is read from or written to the host
// but the schema.
HOXCM_API void ValidateInput(const std::string& component, const std::string& group, const std::string& key,
                             const std::string& input, Document& value, std::vector<ValidationErrorInfo>& findings);

// Builds, for setting `value` (as ValidateInput made it) on the item:
//   currentDocument  the host's current configuration of the item, as a
//                    document {component: {group: {key: item}}}; {} when
//                    the host has none;
//   desiredDocument  the same document with `value` as the item;
//   stagedValue      the item as it would be staged for the next boot.
// Instances of a key whose identities the store generates are matched by
// content: an unchanged instance keeps its host identity, any other is new
// (its "cs_generated_id" in `value` is ignored). Throws 2180, 2001, 2181,
// 2021 as GetConfig, and 2022/2028 for a value of the wrong shape.
HOXCM_API void GenerateSetDocuments(const std::string& component, const std::string& group, const std::string& key,
                                    Document& currentDocument, Document& desiredDocument, Document& stagedValue,
                                    const Document& value);

// The impact of changing the host from `currentDocument` to
// `desiredDocument` (Impact, with the impact plugins run on `taskHandle`;
// with `reasons`, why). A compliant result means the item already has the
// value. A failing or aborted impact plugin throws ConfigManagerException
// 2084 carrying its ErrorInfo.
HOXCM_API ImpactResult CheckImpact(Document& desiredDocument, const Document& currentDocument,
                                   std::shared_ptr<TaskHandle> taskHandle = TaskHandle::Dummy(),
                                   ImpactReasons* reasons = nullptr);

// Applies or stages the change that GenerateSetDocuments described and
// CheckImpact judged, for the item (component, group, key):
//   - boot mode not 0 (a staged change waits for a boot): HostNotInNBM 2029;
//   - the item changed on the host since `currentDocument` was built:
//     InvalidImpact 2025 (build the documents and judge again);
//   - impact 0, or 1 with the host in maintenance mode: the owning plugins
//     run at once in their dependency order (progress and notifications on
//     `taskHandle`); a failing plugin throws ConfigManagerException 2084
//     with its ErrorInfo, and so does an item that no plugin applies;
//   - impact 1 outside maintenance mode: HostNotInMM 2026, nothing changed;
//   - impact 2: `stagedValue` replaces the item in the desired configuration
//     and boot mode becomes 4, in one store transaction; the host is not
//     touched.
// Returns the status as Apply does (APPLY_COMPLETED, also when nothing had
// to change; APPLY_COMPLETED_IN_MAINTENANCE_MODE; APPLY_PENDING_REBOOT) and,
// when the task was aborted, errorInfo "com.tarvik.hox.settings.apply.plugin.
// aborted" with the plugin that did not run (none when the wait for the host
// was aborted); the plugins before it have applied their part. Unlike
// Apply, a plugin's failure is thrown.
HOXCM_API ApplyResult SetConfig(const Document& currentDocument, Document& desiredDocument,
                                     const Document& stagedValue, const ImpactResult& impactResult,
                                     const std::string& component, const std::string& group,
                                     const std::string& key,
                                     std::shared_ptr<TaskHandle> taskHandle = TaskHandle::Dummy());

// Removes the configuration of a singleton item through its plugin (a
// "DELETE" run); nothing happens when the host has none. Returns as
// SetConfig does. Throws
// ConfigManagerException 2180, 2001, 2181 (as GetConfig), 2027 (the key's
// default may be changed but never deleted), 2084 (no plugin applies the
// item, or the plugin failed: its ErrorInfo); InvalidArgumentException 2021
// (no schema), 2022 (a multi-instance key: set its instances instead);
// HostNotInNBM 2029 (a staged change waits for a boot); HostNotInMM 2026
// (the key's schema requires maintenance mode to delete it).
HOXCM_API ApplyResult DeleteConfig(const std::string& component, const std::string& group,
                                        const std::string& key,
                                        std::shared_ptr<TaskHandle> taskHandle = TaskHandle::Dummy());

// The plugin error that a 2084 of CheckImpact, SetConfig or DeleteConfig
// carries; nullopt for any other exception.
HOXCM_API std::optional<ErrorInfo> PluginErrorOf(const HoxConfigStore::ConfigStoreException& error);

}  // namespace HoxConfigManager
