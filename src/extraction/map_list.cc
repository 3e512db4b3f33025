// Map-list processing: configuration-store rows become items of a host
// document. Shared by every extraction.
#include <algorithm>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include <hoxcm/documents.h>
#include <hoxcm/host.h>
#include <hoxcm/extraction.h>

#include "extraction/extraction_internal.h"

namespace HoxConfigManager {
namespace {

namespace RowColumn = HoxConfigStore::RowColumn;

using HoxConfigStore::ConfigMap;
using HoxConfigStore::ConfigStoreDocument;
using HoxSchemaStore::SchemaObject;
using HoxSchemaStore::SchemaObjectId;


// Validator findings that only summarise another finding (a failed "oneOf"
// because its tag is missing, ...): auto-configuration answers the
// underlying finding and has nothing to say about the summary.
const std::set<int>& AutoConfIgnoredErrors() {
  static const std::set<int> kIgnored = {
      JsonValidator::VALIDATION_ERR_ONE_OF, JsonValidator::VALIDATION_ERR_ANY_OF,
      JsonValidator::VALIDATION_ERR_ALL_OF, JsonValidator::VALIDATION_ERR_NOT};
  return kIgnored;
}

// Clean-up of each document type (the meaning of each action is the store's).
// Current and desired documents feed the drift walk and the boot-time apply,
// which must see what is stored, store-generated identities and explicit
// defaults included; only null members, which mean "absent", go. An exported
// profile is a portable statement of intent: no generated identities, no
// nulls or empty objects, no values equal to the schema default, nothing the
// schema does not describe.
const std::vector<HoxConfigStore::CLEANUP_ACTIONS>& CleanupActions(DocumentType type) {
  using namespace HoxConfigStore;
  static const std::vector<CLEANUP_ACTIONS> kProfile = {CLEANUP_REMOVE_GENERATED_ID, CLEANUP_REMOVE_NULLS,
                                                        CLEANUP_REMOVE_EMPTY_OBJECTS, CLEANUP_REMOVE_DEFAULTS,
                                                        CLEANUP_REMOVE_UNKNOWN};
  static const std::vector<CLEANUP_ACTIONS> kStored = {CLEANUP_REMOVE_NULLS};
  return type == DOCUMENT_PROFILE ? kProfile : kStored;
}

// Rows arrive ordered by key, so one key's schema serves a run of rows; the
// lookup is repeated only when the key changes.
class SchemaLookup {
 public:
  explicit SchemaLookup(const std::shared_ptr<HoxSchemaStore::SchemaStore>& store) : store_(store) {}

  const SchemaObject& Find(const std::string& component, const std::string& group, const std::string& key) {
    if (!schema_ || key != key_ || group != group_ || component != component_) {
      schema_ = store_->Find(component, group, key);
      // A stored item without a schema cannot be cleaned, identified or
      // validated: refuse the extraction rather than guess.
      if (!schema_) {
        const SchemaObjectId id(component, group, key);
        HoxSchemaStore::ThrowSchemaNotFound(store_.get(), id, id.toString());
      }
      component_ = component;
      group_ = group;
      key_ = key;
    }
    return *schema_;
  }

 private:
  const std::shared_ptr<HoxSchemaStore::SchemaStore>& store_;
  std::string component_, group_, key_;
  std::shared_ptr<SchemaObject> schema_;
};

// The columns of one contents row, read in one pass over the row's members
// (a row has at most six, and a tree lookup per column costs more).
struct RowColumns {
  const std::string* component = &Empty();
  const std::string* group = &Empty();
  const std::string* key = &Empty();
  const std::string* identifier = &Empty();
  const std::string* value = &Empty();
  const std::string* autoConf = nullptr;

  explicit RowColumns(const HoxConfigStore::ConfigRow& row)
      : component(&row.component),
        group(&row.group),
        key(&row.key),
        identifier(&row.identifier),
        value(&row.value),
        autoConf(row.hasAutoConfValue ? &row.autoConfValue : nullptr) {}
  explicit RowColumns(const ConfigMap& row) {
    for (const auto& [name, text] : row) {
      const std::string_view column(name);
      if (column == RowColumn::kComponent) {
        component = &text;
      } else if (column == RowColumn::kGroup) {
        group = &text;
      } else if (column == RowColumn::kKey) {
        key = &text;
      } else if (column == RowColumn::kIdentifier) {
        identifier = &text;
      } else if (column == RowColumn::kValue) {
        value = &text;
      } else if (column == RowColumn::kAutoConfValue) {
        autoConf = &text;
      }
    }
  }
  static const std::string& Empty() {
    static const std::string kEmpty;
    return kEmpty;
  }
};

// Whether a null sits anywhere in `value`: removing nulls is the only
// clean-up of stored documents, and most values have none.
bool ContainsNull(const Value& value) {
  if (value.IsNull()) return true;
  if (value.IsObject()) {
    for (const auto& member : value.GetObject()) {
      if (ContainsNull(member.value)) return true;
    }
  } else if (value.IsArray()) {
    for (const Value& element : value.GetArray()) {
      if (ContainsNull(element)) return true;
    }
  }
  return false;
}

bool IsQuorlet(const std::string& component, const std::string& group, const std::string& key) {
  const SchemaObjectId& quorlet = detail::QuorletObjectId();
  return key == quorlet.key && group == quorlet.group && component == quorlet.component;
}

}  // namespace

void ProcessAutoConfig(Value& value, const Value& schema, const std::string& autoConfValue, Allocator& allocator) {
  if (autoConfValue.empty()) {
    CSLogger::Log(CSLogger::kDetail, "No auto configuration to process");
    return;
  }
  Document autoConf;
  ParseDocument(autoConfValue, autoConf);

  Document errors;
  JsonValidator::Validate(schema, value, errors, AutoConfIgnoredErrors(), "");
  RAPIDJSON_ASSERT(errors.IsArray());
  for (const Value& error : errors.GetArray()) {
    RAPIDJSON_ASSERT(error.IsObject());
    const std::string field = error["field"].GetString();
    const char* text = error["error"].GetString();
    switch (error["errId"].GetInt()) {
      case JsonValidator::VALIDATION_ERR_REQUIRED:
        CSLogger::Log(CSLogger::kInfo, "patching validation error: '%s' %s", field.c_str(), text);
        if (!ConfigStoreDocument::PatchRequiredProperty(value, field, autoConf, allocator)) {
          CSLogger::Log(CSLogger::kDetail, "No auto configuration value for '%s'", field.c_str());
        }
        break;
      case JsonValidator::VALIDATION_ERR_UNION_TAG:
        if (!ConfigStoreDocument::PatchUnionTagProperty(value, field, autoConf, allocator)) {
          CSLogger::Log(CSLogger::kDetail, "No auto configuration value for '%s'", field.c_str());
        }
        break;
      default:
        CSLogger::Log(CSLogger::kError, "unexpected validation error: '%s' %s", field.c_str(), text);
        break;
    }
  }
}

namespace detail {

// Everything a run of rows shares: the target, the clean-up, the schema of
// the current key, the parser.
struct RowProcessor::State {
  State(Document& result, const std::shared_ptr<HoxSchemaStore::SchemaStore>& store, DocumentType type)
      : items(DocumentShape::Unwrap(result)),
        allocator(result.GetAllocator()),
        cleanup(CleanupActions(type)),
        onlyNulls(cleanup.size() == 1 && cleanup.front() == HoxConfigStore::CLEANUP_REMOVE_NULLS),
        schemas(store),
        parsed(&allocator),
        logItems(CSLogger::IsEnabled(CSLogger::kInfo)) {}

  Value& items;
  Allocator& allocator;
  const std::vector<HoxConfigStore::CLEANUP_ACTIONS>& cleanup;
  const bool onlyNulls;
  SchemaLookup schemas;
  // Read once, and only when a quorlet row shows up.
  std::optional<std::set<SchemaObjectId>> dspExcluded;
  // One parser reused for every row: its stack keeps its capacity, and the
  // parsed values land directly in the result's pool.
  Document parsed;
  // The per-item lines are the bulk of the log; skip formatting them when
  // the threshold hides them anyway.
  const bool logItems;

  void Add(const RowColumns& columns);
};

RowProcessor::RowProcessor(Document& result, const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore,
                           DocumentType type)
    : schemaStore_(schemaStore) {
  CSLogger::Log(CSLogger::kDetail, "%s invoked with DocumentType=%d", "ProcessConfigMapList", static_cast<int>(type));
  if (!schemaStore_) ThrowException<ConfigManagerException>(SchemaStoreAccessFailed);
  if (!result.IsObject()) result.SetObject();
  if (type == DOCUMENT_PROFILE) ConfigStoreDocument::AddProfile(result);
  state_ = std::make_unique<State>(result, schemaStore_, type);
}

RowProcessor::~RowProcessor() = default;

void RowProcessor::Add(const HoxConfigStore::ConfigRow& row) { state_->Add(RowColumns(row)); }

void RowProcessor::Add(const ConfigMap& row) { state_->Add(RowColumns(row)); }

void RowProcessor::State::Add(const RowColumns& columns) {
  State& st = *this;
  const std::string& key = *columns.key;
  const std::string& component = *columns.component;
  const std::string& group = *columns.group;
  const std::string& identifier = *columns.identifier;
  if (st.logItems) {
    CSLogger::Log(CSLogger::kInfo, "Configuration for {%s/%s/%s/%s} was found.", component.c_str(), group.c_str(),
                  key.c_str(), identifier.c_str());
  }

  const std::string& text = *columns.value;
  if (text == DocumentShape::kDeleteDefault) {
    ThrowException<ConfigManagerException>(DeleteDefaultNotSupported,
                                           SchemaObjectId(component, group, key).toString());
  }

  if (IsQuorlet(component, group, key)) {
    if (!st.dspExcluded) st.dspExcluded = detail::DspExcludedObjects();
    if (st.dspExcluded->count(detail::QuorletObjectId()) != 0) {
      CSLogger::Log(CSLogger::kInfo, "Configuration for {%s/%s/%s} was not extracted, since dspIntegrated=False,",
                    component.c_str(), group.c_str(), key.c_str());
      return;
    }
  }

  ParseDocument(text, st.parsed);
  Value value;
  value.Swap(st.parsed);
  RAPIDJSON_ASSERT(value.IsObject());

  const SchemaObject& schema = st.schemas.Find(component, group, key);
  // An instance row of a singleton key, or an instance without identifier,
  // would give the key the wrong shape in the document.
  if (schema.IsMultiInstance() == identifier.empty()) {
    ThrowException<ConfigManagerException>(InvalidKeyValue, "/" + component + "/" + group + "/" + key);
  }
  if (columns.autoConf != nullptr) {
    ProcessAutoConfig(value, schema.GetInstanceSchema(), *columns.autoConf, st.allocator);
  }

  if (schema.GetIdentityMember() != DocumentShape::kGeneratedId) {
    const std::vector<std::string>& solutionIds = schema.GetSolutionInstanceIds();
    if (!identifier.empty() && std::find(solutionIds.begin(), solutionIds.end(), identifier) != solutionIds.end()) {
      CSLogger::Log(CSLogger::kInfo,
                    "Configuration for {%s/%s/%s/%s} was not extracted, since instance is created by a solution.",
                    component.c_str(), group.c_str(), key.c_str(), identifier.c_str());
      return;
    }
  }

  if (!st.onlyNulls || ContainsNull(value)) {
    ConfigStoreDocument::CleanupObject(value, schema.GetInstanceSchema(), st.cleanup, st.allocator);
  }
  if (value.ObjectEmpty()) {
    if (st.logItems) {
      CSLogger::Log(CSLogger::kInfo, "Configuration for {%s/%s/%s/%s} was filtered out.", component.c_str(),
                    group.c_str(), key.c_str(), identifier.c_str());
    }
    return;
  }
  ConfigStoreDocument::AddItem(st.items, component, group, key, identifier, value, st.allocator);
}

}  // namespace detail

void ProcessConfigMapList(Document& result, const HoxConfigStore::ConfigMapList& contents,
                          const std::shared_ptr<HoxSchemaStore::SchemaStore>& schemaStore, DocumentType type) {
  detail::RowProcessor rows(result, schemaStore, type);
  for (const auto& row : contents) {
    RAPIDJSON_ASSERT(row != nullptr);
    rows.Add(*row);
  }
}

}  // namespace HoxConfigManager
