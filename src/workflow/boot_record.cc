// The boot-apply record (its serialized form and its reading for management
// clients) and the desired SmartNIC configuration.
#include <time.h>

#include <hoxcm/boot.h>
#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/json.h>

namespace HoxConfigManager {
namespace {

// Day-month-year, then the time with dashes: the form boot records have
// always had, in local time both ways.
constexpr const char* kTimeFormat = "%d-%m-%Y %H-%M-%S";

[[noreturn]] void InvalidRecord() { throw HoxConfigStore::ConfigStoreException("Invalid JSON"); }

std::string LocalTimeText(std::time_t time) {
  struct tm local {};
  char text[64];
  if (::localtime_r(&time, &local) == nullptr || std::strftime(text, sizeof text, kTimeFormat, &local) == 0) {
    return "01-01-1970 00-00-00";
  }
  return text;
}

std::time_t FromLocalTimeText(const std::string& text) {
  struct tm local {};
  const char* end = ::strptime(text.c_str(), kTimeFormat, &local);
  if (end == nullptr || *end != '\0') InvalidRecord();
  local.tm_isdst = -1;  // as the clock said then
  const std::time_t time = std::mktime(&local);
  if (time == static_cast<std::time_t>(-1)) InvalidRecord();
  return time;
}

}  // namespace

std::string BootApplyErrorInfo::Serialize() const {
  Document doc(rapidjson::kObjectType);
  auto& a = doc.GetAllocator();
  // The error as text inside the record, not as a nested object.
  doc.AddMember("errorInfo", Value(errorInfo.Serialize(), a), a);
  doc.AddMember("time", Value(LocalTimeText(time), a), a);
  return JsonToString(doc);
}

void BootApplyErrorInfo::Deserialize(std::string text) {
  Document doc;
  try {
    ParseDocument(text, doc);
  } catch (const HoxConfigStore::ConfigStoreException&) {
    InvalidRecord();
  }
  RAPIDJSON_ASSERT(doc.IsObject() && doc.HasMember("errorInfo") && doc.HasMember("time"));
  RAPIDJSON_ASSERT(doc["errorInfo"].IsString() && doc["time"].IsString());
  ErrorInfo error;
  error.Deserialize(doc["errorInfo"].GetString());
  time = FromLocalTimeText(doc["time"].GetString());
  errorInfo = std::move(error);
}

BootApplyInfo GetBootApplyInfo() {
  CSLogger::Log(CSLogger::kInfo, "%s invoked", "GetBootApplyInfo");
  BootApplyInfo info;
  const Document record = HoxConfigStore::getBootApplyRecord();
  RAPIDJSON_ASSERT(record.IsObject() && record.HasMember("isBootComplete") && record["isBootComplete"].IsBool());
  if (!record["isBootComplete"].GetBool()) {
    info.status = BOOT_APPLY_IN_PROGRESS;
    return info;
  }
  RAPIDJSON_ASSERT(record.HasMember("bootApplyRecord") && record["bootApplyRecord"].IsString());
  BootApplyErrorInfo run;
  run.Deserialize(record["bootApplyRecord"].GetString());
  if (!run.errorInfo.id.empty()) {
    CSLogger::Log(CSLogger::kError, "Detected failure during boot-time apply. ErrId: %s", run.errorInfo.id.c_str());
    info.errors.push_back(std::move(run));
  }

  const std::vector<HoxConfigStore::FailureRecord> failures = HoxConfigStore::GetBootTimeRestoreFailures();
  info.status = failures.empty() && info.errors.empty() ? BOOT_APPLY_SUCCEEDED : BOOT_APPLY_FAILED;
  for (const HoxConfigStore::FailureRecord& f : failures) {
    CSLogger::Log(CSLogger::kError, "Failed to apply configuration during boot for component: %s, group: %s and key: %s",
                  f.component.c_str(), f.group.c_str(), f.key.c_str());
    const std::string item = "/" + f.component + "/" + f.group + "/" + f.key;
    info.errors.emplace_back(std::time(nullptr),
                             ErrorInfo(kBootRestoreFailed, {f.component, f.group, f.key},
                                       "The configuration staged for " + item + " was not put in effect during boot."));
  }
  return info;
}

void SetSmartnicConfiguration(const std::string& jsonText) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked", "SetSmartnicConfiguration");
  Document doc;
  ParseDocument(jsonText, doc);
  HoxConfigStore::SetDesiredSmartnicConfiguration(doc);
}

}  // namespace HoxConfigManager
