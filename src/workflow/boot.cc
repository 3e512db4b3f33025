// Bootstrap and the boot-time run. Both hold the host run lock for their
// whole run, catch every exception themselves (a boot script has nobody to
// catch for it) and leave the store either as it was or wholly updated: each
// writes its state in one store transaction.
#include "workflow/boot.h"

#include <chrono>
#include <exception>
#include <filesystem>
#include <memory>
#include <optional>
#include <set>
#include <stdexcept>
#include <tuple>
#include <unordered_map>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/files.h>
#include <hoxcm/host.h>
#include <hoxcm/host_documents.h>
#include <hoxcm/operations.h>
#include <hoxcm/schema_store.h>

#include "workflow/apply_history.h"
#include "workflow/impact.h"
#include "workflow/remediation.h"
#include "workflow/validation.h"

namespace HoxConfigManager {
namespace {

using HoxConfigStore::ConfigStore;
using HoxConfigStore::ConfigStoreTransaction;
namespace HostPaths = HoxPlatform::HostPaths;

// The store's objects outside the host configuration; the texts of the
// failures are the ones boot scripts have always matched.
std::shared_ptr<ConfigStore> GlobalStore() {
  std::shared_ptr<ConfigStore> store = ConfigStore::GetStore(HoxConfigStore::sGlobalNamespace);
  if (!store) throw std::runtime_error("Failed to access ConfigStore.");
  return store;
}

// The host run lock for a whole boot-time operation, and the runner its
// plugins run through: the given one, or a LaunchingRunner under the lock.
class HostLock {
 public:
  explicit HostLock(PluginRunner* given)
      : lock_(LaunchingRunner::LockHost({[] { CSLogger::Log(CSLogger::kInfo, "Waiting for another apply to finish."); },
                                         [] { return false; }})),
        launching_(*lock_),
        runner_(given != nullptr ? *given : launching_) {}
  PluginRunner& runner() { return runner_; }

 private:
  const std::unique_ptr<HoxPlatform::HostRunLock> lock_;
  LaunchingRunner launching_;  // runs under lock_, so declared after it
  PluginRunner& runner_;
};

// The apply history record of one boot-time operation, appended when it
// goes out of scope unless dropped; appending never throws.
class HistoryEntry {
 public:
  explicit HistoryEntry(const char* kind) : start_(std::chrono::steady_clock::now()) {
    record.kind = kind;
    record.startedAt = static_cast<int64_t>(std::time(nullptr));
  }
  HistoryEntry(const HistoryEntry&) = delete;
  HistoryEntry& operator=(const HistoryEntry&) = delete;
  ~HistoryEntry() {
    if (!keep) return;
    record.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
    AppendApplyHistoryOrLog(record);
  }
  // The outcome of a remediation: its runs and its error.
  void Ran(const RemediationOutcome& outcome, bool hadTasks) {
    record.runs = HistoryRuns(outcome.runs);
    RecordResult(record, ApplyResult{APPLY_COMPLETED, outcome.error}, !hadTasks);
  }

  ApplyHistoryRecord record;
  bool keep = true;

 private:
  const std::chrono::steady_clock::time_point start_;
};

void LogValidation(const ValidationResult& result) {
  if (!result.error.id.empty()) {
    CSLogger::Log(CSLogger::kError, "Validation could not complete: %s %s", result.error.id.c_str(),
                  result.error.message.c_str());
  }
  for (const ValidationErrorInfo& field : result.errors) {
    for (const ErrorInfo& error : field.errors) {
      std::string args;
      for (const std::string& arg : error.args) args += (args.empty() ? "" : ", ") + arg;
      CSLogger::Log(CSLogger::kError, "Invalid value at %s: %s (%s)", field.field.c_str(), error.id.c_str(),
                    args.c_str());
    }
  }
}

// Moves the auto-deployment files into the store beside the staged document
// and sets the boot mode that refuses single-item changes until the boot.
// Nothing is committed unless every step succeeded; the files are removed
// only once their contents are in the (uncommitted) transaction.
void StageBootstrap(Document& document) {
  const std::shared_ptr<ConfigStore> store = GlobalStore();
  ConfigStoreTransaction transaction(store);
  HoxConfigStore::SetDesiredUserConfig(document);

  const std::string waiterPath = HoxPlatform::HostPath(HostPaths::kAutodeployWaiterNotify);
  const std::string firewallPath = HoxPlatform::HostPath(HostPaths::kAutodeployFirewall);
  if (!fileExists(waiterPath)) throw std::runtime_error("waiterNotify.json file does not exists.");
  if (!fileExists(firewallPath)) throw std::runtime_error("autodeploy.xml firewall config does not exists.");

  CSLogger::Log(CSLogger::kInfo, "Preserving {%s} contents in ConfigStore.", waiterPath.c_str());
  Document waiter;
  CreateDocumentFromFile(waiterPath.c_str(), waiter);
  std::string waiterText;
  HoxConfigStore::ConfigStoreDocument::SerializeValue(waiter, waiterText);

  CSLogger::Log(CSLogger::kInfo, "Preserving {%s} contents in ConfigStore.", firewallPath.c_str());
  std::string firewall;
  try {
    firewall = HoxPlatform::ReadFile(firewallPath, HoxPlatform::FileKind::HostFile);
  } catch (const HoxPlatform::FileError& e) {
    CSLogger::Log(CSLogger::kError, "%s", e.what());
    throw std::runtime_error("autodeploy.xml firewall config failed to open.");
  }

  HoxConfigStore::ConfigStoreObject preserved(AutodeployObjectId());
  preserved.SetValue(kWaiterNotifyValue, waiterText);
  preserved.SetValue(kFirewallValue, firewall);
  GlobalStore()->SetObject(preserved);
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_BOOTSTRAP);

  if (const int rc = HoxPlatform::RemoveFile(waiterPath); rc != 0) {
    CSLogger::Log(CSLogger::kError, "Failed to remove {%s} rc=%d", waiterPath.c_str(), rc);
    throw std::runtime_error("Failed to remove waiterNotify.json.");
  }
  if (const int rc = HoxPlatform::RemoveFile(firewallPath); rc != 0) {
    CSLogger::Log(CSLogger::kError, "Failed to remove {%s} rc=%d", firewallPath.c_str(), rc);
  }
  transaction.Commit();
  CSLogger::Log(CSLogger::kInfo,
                "ApplyConfig updated the host with the desired configuration document, host must be rebooted for it "
                "to take effect.");
}

int32_t Bootstrap(const std::string& path, PluginRunner* given) {
  CSLogger::Log(CSLogger::kInfo, "Bootstrap host using configuration document {%s}", path.c_str());
  std::optional<HistoryEntry> history;
  try {
    HostLock host(given);
    Document document;
    CreateDocumentFromFile(path.c_str(), document);

    Document schema;
    if (!GenerateHostDocumentSchema(document, schema)) {
      CSLogger::Log(CSLogger::kError, "Failed to generate schema for boot document");
      return 1;
    }
    CSLogger::Log(CSLogger::kInfo, "Generated host configuration document schema.");
    ValidationResult validation;
    Validate(document, schema, "", validation, true, TaskHandle::Dummy(), host.runner());
    if (!validation.IsValid()) {
      LogValidation(validation);
      CSLogger::Log(CSLogger::kError, "Failed to validate boot configuration document");
      return 1;
    }
    CSLogger::Log(CSLogger::kInfo, "Validated host configuration document.");

    ImpactResult impact;
    ImpactReasons reasons;
    Impact(document, "", impact, TaskHandle::Dummy(), std::nullopt, &reasons, host.runner());
    if (!impact.error.id.empty()) {
      CSLogger::Log(CSLogger::kError, "Failed to compute impact for host configuration document");
      return 1;
    }
    // From here on the bootstrap changes the host (or tries to): it is
    // recorded whatever becomes of it.
    history.emplace("bootstrap");
    history->record.document = DocumentDigest(document);
    RecordVerdict(history->record, impact, reasons);

    if (impact.impact == IMPACT_REBOOT_REQUIRED) {
      StageBootstrap(document);
      RecordResult(history->record, ApplyResult{APPLY_PENDING_REBOOT, {}}, false);
      return 0;
    }
    // Unlike an apply, no maintenance-mode check: the host is being set up.
    CSLogger::Log(CSLogger::kInfo, "Remediating with host configuration document.");
    const RemediationOutcome outcome = RemediateHostRuns(document, "", TaskHandle::Dummy(), false, host.runner());
    history->Ran(outcome, !impact.compliant);
    if (!outcome.error.id.empty()) {
      CSLogger::Log(CSLogger::kError, "Failed to boostrap host with configuration.");
      return 1;
    }
    CSLogger::Log(CSLogger::kInfo, "Host boostrap with configuration successful.");
    return 0;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to bootstrap host error=%s", e.what());
    if (history) RecordException(history->record, std::current_exception());
  } catch (...) {
    CSLogger::Log(CSLogger::kError, "Failed to bootstrap host error=%s", "unknown exception");
    if (history) RecordException(history->record, std::current_exception());
  }
  return 1;
}

// Writes the auto-deployment files a bootstrap preserved, then removes the
// preserved object so that later boots leave the files alone. A failure
// before the removal leaves the object for the next boot.
void RegenerateAutodeployFiles(ConfigStore& store) {
  const std::shared_ptr<HoxConfigStore::ConfigStoreObject> preserved = store.GetObject(AutodeployObjectId());
  if (!preserved) return;
  std::string text;
  if (preserved->GetValue(kWaiterNotifyValue, &text) && !text.empty()) {
    const std::string path = HoxPlatform::HostPath(HostPaths::kAutodeployWaiterNotify);
    CSLogger::Log(CSLogger::kInfo, "Generating {%s} file from ConfigStore contents", path.c_str());
    const Document waiter = HoxConfigStore::ConfigStoreDocument::CreateDocument(text);
    HoxPlatform::CreateDirectories(std::filesystem::path(path).parent_path().string());
    CreateFileFromDocument(path.c_str(), waiter);
  }
  text.clear();
  if (preserved->GetValue(kFirewallValue, &text) && !text.empty()) {
    const std::string path = HoxPlatform::HostPath(HostPaths::kAutodeployFirewall);
    CSLogger::Log(CSLogger::kInfo, "Generating {%s} file from ConfigStore contents", path.c_str());
    try {
      HoxPlatform::CreateDirectories(std::filesystem::path(path).parent_path().string());
    } catch (const HoxPlatform::FileError& e) {
      CSLogger::Log(CSLogger::kError, "%s", e.what());
      throw std::runtime_error("Failed to create autodeploy.xml");
    }
    try {
      // Byte for byte, private as the JSON file, and on disk before the
      // preserved copy goes.
      HoxPlatform::WriteFileAtomically(path, text, 0600, HoxPlatform::Durability::kDurable);
    } catch (const HoxPlatform::FileError& e) {
      CSLogger::Log(CSLogger::kError, "%s", e.what());
      throw std::runtime_error("Failed to write to autodeploy.xml");
    }
  }
  store.DeleteObject(AutodeployObjectId());
}

// A staged instance of a key whose identities the store generates carries
// the identity the store gave it when it was staged, the host's equal
// instance another one. Each staged instance takes the identity of the
// first equal host instance not taken yet (equal as the drift walk compares
// them), so that applying it updates that instance instead of adding a copy.
void AdoptHostIdentities(Document& staged) {
  const std::shared_ptr<HoxSchemaStore::SchemaStore> schemas = HoxSchemaStore::SchemaStore::GetStore();
  if (!schemas) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  const std::shared_ptr<HoxConfigStore::DBStore> db = HoxConfigStore::GetDBStore();
  auto& a = staged.GetAllocator();
  DocumentShape::ForEachItem(DocumentShape::Unwrap(staged), [&](const DocumentShape::Item<Value>& item) {
    if (!item.value.IsArray()) return;
    const auto schema = schemas->Find(item.component.GetString(), item.group.GetString(), item.key.GetString());
    if (!schema || schema->GetIdentityMember() != DocumentShape::kGeneratedId) return;
    const Document host =
        HoxConfigStore::GetCurrentConfigInternal(db, item.component.GetString(), item.group.GetString(), item.key.GetString());
    if (!host.IsArray()) return;
    const Value& instanceSchema = schema->GetInstanceSchema();
    std::unordered_multimap<std::size_t, rapidjson::SizeType> byHash;
    for (rapidjson::SizeType j = 0; j < host.Size(); ++j) {
      byHash.emplace(HoxConfigStore::ConfigStoreDocument::HashValue(host[j], instanceSchema), j);
    }
    std::vector<bool> taken(host.Size(), false);
    for (Value& instance : item.value.GetArray()) {
      if (!instance.IsObject()) continue;
      std::optional<rapidjson::SizeType> match;
      auto [first, last] = byHash.equal_range(HoxConfigStore::ConfigStoreDocument::HashValue(instance, instanceSchema));
      for (; first != last; ++first) {
        const rapidjson::SizeType j = first->second;
        if (taken[j] || !HoxConfigStore::ConfigStoreDocument::IsEqualValue(instance, host[j], instanceSchema)) continue;
        if (!match || j < *match) match = j;  // the first in host order
      }
      if (!match) continue;
      taken[*match] = true;
      const auto id = host[*match].FindMember(Value(DocumentShape::Ref(DocumentShape::kGeneratedId)));
      if (id == host[*match].MemberEnd() || !id->value.IsString()) continue;
      const auto own = instance.FindMember(Value(DocumentShape::Ref(DocumentShape::kGeneratedId)));
      if (own != instance.MemberEnd()) {
        own->value.SetString(id->value.GetString(), id->value.GetStringLength(), a);
      } else {
        instance.AddMember(Value(DocumentShape::Ref(DocumentShape::kGeneratedId)), Value(id->value, a), a);
      }
    }
  });
}

// The keys whose staged configuration the host does not hold after the run:
// what the drift walk still finds between the staged document and the host,
// one entry per key, in task order. A key no boot-capable plugin owns counts
// only when the host differs from what was staged.
std::vector<HoxConfigStore::FailureRecord> NotInEffect(Document& staged) {
  std::vector<HoxConfigStore::FailureRecord> failures;
  try {
    std::set<std::tuple<std::string, std::string, std::string>> seen;
    for (const DesiredConfigInput& task : GenerateApplyTasks(staged)) {
      const HoxConfigStore::ConfigStoreObjectId& id = task.object->GetConfigStoreObjectId();
      if (seen.emplace(id.component, id.group, id.key).second) failures.push_back({id.component, id.group, id.key});
    }
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to compare the staged configuration with the host: %s", e.what());
  }
  return failures;
}

// The end of a run that reached its outcome, in one transaction: the record,
// the keys not in effect, the staged configuration consumed, boot mode back
// to normal (single-item changes are allowed again).
void FinishBoot(const BootApplyErrorInfo& outcome, const std::vector<HoxConfigStore::FailureRecord>& failures) {
  const std::shared_ptr<ConfigStore> store = GlobalStore();
  ConfigStoreTransaction transaction(store);
  HoxConfigStore::setBootApplyRecord(outcome.Serialize());
  HoxConfigStore::ClearBootTimeRestoreFailures();
  for (const HoxConfigStore::FailureRecord& failure : failures) HoxConfigStore::AddBootTimeRestoreFailure(failure);
  Document nothing(rapidjson::kObjectType);
  HoxConfigStore::SetDesiredUserConfig(nothing);
  HoxConfigStore::SetBootMode(HoxConfigStore::BOOTMODE_NORMAL);
  transaction.Commit();
}

// A run that could not complete still leaves a record (and no restore
// failures of an earlier boot), so that the boot's status does not show an
// earlier outcome; the staged configuration and boot mode stay for the next
// attempt.
void RecordIncompleteRun(const std::string& reason) {
  try {
    const BootApplyErrorInfo outcome(std::time(nullptr),
                                     ErrorInfo(kBootApplyFailed, {reason}, "The boot-time apply failed: " + reason));
    ConfigStoreTransaction transaction(GlobalStore());
    HoxConfigStore::setBootApplyRecord(outcome.Serialize());
    HoxConfigStore::ClearBootTimeRestoreFailures();
    transaction.Commit();
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to record the boot-time apply: %s", e.what());
  }
}

bool BootRun(PluginRunner* given) {
  HistoryEntry history("boot");
  try {
    FeatureState_InitSilentMode();
    const std::shared_ptr<ConfigStore> store = GlobalStore();
    HostLock host(given);
    RegenerateAutodeployFiles(*store);

    Document desired = ExtractDesiredConfiguration();
    AdoptHostIdentities(desired);
    const bool staged = desired.IsObject() && desired.MemberCount() > 0;
    if (staged) history.record.document = DocumentDigest(desired);
    const RemediationOutcome outcome = RemediateHostRuns(desired, "", TaskHandle::Dummy(), true, host.runner());
    history.Ran(outcome, staged);
    const bool failed = !outcome.error.id.empty();
    if (failed) CSLogger::Log(CSLogger::kError, "Failed to apply boot-time configuration errId=%s", outcome.error.id.c_str());
    // A boot with nothing staged that went well is not worth a history
    // record: it would push real applies out of the history.
    history.keep = staged || failed;
    FinishBoot(BootApplyErrorInfo(std::time(nullptr), outcome.error),
               staged ? NotInEffect(desired) : std::vector<HoxConfigStore::FailureRecord>{});
    return failed;
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to apply boot-time configuration. %s", e.what());
    history.keep = true;
    RecordException(history.record, std::current_exception());
    RecordIncompleteRun(e.what());
  } catch (...) {
    CSLogger::Log(CSLogger::kError, "Failed to apply boot-time configuration. %s", "unknown exception");
    history.keep = true;
    RecordException(history.record, std::current_exception());
    RecordIncompleteRun("unknown exception");
  }
  return true;
}

}  // namespace

HoxConfigStore::ConfigStoreObjectId AutodeployObjectId() { return {"autodeploy", "bootstrap", "hox"}; }

int32_t ApplyBootDocument(const std::string& path) { return Bootstrap(path, nullptr); }
int32_t ApplyBootDocument(const std::string& path, PluginRunner& runner) { return Bootstrap(path, &runner); }

bool ExecuteBootPlugins() { return BootRun(nullptr); }
bool ExecuteBootPlugins(PluginRunner& runner) { return BootRun(&runner); }

}  // namespace HoxConfigManager
