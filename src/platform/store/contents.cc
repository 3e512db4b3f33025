// Configuration contents: the rows of the user, default, desired and SmartNIC
// configuration, read as row maps and written from host documents or from
// the changes of a plugin run.
#include <set>
#include <string_view>
#include <tuple>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/schema_store.h>

#include "foundation/json_parse.h"
#include "platform/store/database.h"

namespace HoxConfigStore {

using detail::Database;
using detail::Statement;

namespace {

namespace Shape = HoxConfigManager::DocumentShape;

struct ItemRow {
  std::string component;
  std::string group;
  std::string key;
  std::string identifier;
  std::string value;
};

// The key's schema; null when the schema store or the key's schema is
// missing (the contents are then stored by their JSON shape alone).
std::shared_ptr<HoxSchemaStore::SchemaObject> FindSchema(const std::string& component, const std::string& group,
                                                         const std::string& key) {
  auto store = HoxSchemaStore::SchemaStore::GetStore();
  if (!store) return nullptr;
  return HoxSchemaStore::GetSchema(component, group, key, store);
}

bool IsMultiInstance(const HoxSchemaStore::SchemaObject* schema, const rapidjson::Value& value) {
  return schema != nullptr ? schema->IsMultiInstance() : value.IsArray();
}

// The identifier of one instance. With generated identities (and for
// instances of keys without schema) the instance keeps the "cs_generated_id"
// it has or is given a fresh one, written into the instance.
std::string IdentifyInstance(rapidjson::Value& instance, rapidjson::MemoryPoolAllocator<>& allocator,
                             const HoxSchemaStore::SchemaObject* schema, const std::string& requested) {
  RAPIDJSON_ASSERT(instance.IsObject());
  const std::string member = schema != nullptr ? schema->GetIdentityMember() : std::string(Shape::kGeneratedId);
  if (member.empty()) return requested;
  auto it = instance.FindMember(member.c_str());
  if (member == Shape::kGeneratedId) {
    std::string id = requested;
    if (id.empty() && it != instance.MemberEnd() && it->value.IsString()) id = it->value.GetString();
    if (id.empty()) id = GenerateInstanceId();
    if (it == instance.MemberEnd()) {
      instance.AddMember(Shape::Ref(Shape::kGeneratedId), rapidjson::Value(id, allocator), allocator);
    } else {
      it->value.SetString(id, allocator);
    }
    return id;
  }
  if (!requested.empty()) {
    // A row whose value names another instance could never be found again
    // by that name (to be changed or deleted).
    if (it != instance.MemberEnd() && it->value.IsString() &&
        std::string_view(it->value.GetString(), it->value.GetStringLength()) != requested) {
      HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
          HoxConfigManager::InvalidKeyValue, member + " (the value names another instance than " + requested + ")");
    }
    return requested;
  }
  if (it == instance.MemberEnd() || !it->value.IsString() || it->value.GetStringLength() == 0) {
    HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
        HoxConfigManager::InvalidKeyValue, member);
  }
  return std::string(it->value.GetString(), it->value.GetStringLength());
}

// The stored text of a value. A value built in code may hold what no JSON
// text can (a string that is not UTF-8, a NaN); stored, it would make every
// later reader of its rows fail, so it is refused before the write.
std::string Serialize(const rapidjson::Value& value) {
  rapidjson::StringBuffer buffer;
  rapidjson::Writer<rapidjson::StringBuffer, rapidjson::UTF8<>, rapidjson::UTF8<>, rapidjson::CrtAllocator,
                    rapidjson::kWriteValidateEncodingFlag>
      writer(buffer);
  if (!value.Accept(writer)) throw ConfigStoreException(2000, "Invalid JSON");
  return std::string(buffer.GetString(), buffer.GetSize());
}

// One row per singleton and per instance of a host document ("profile"
// unwrapped), in document order. Throws before anything is written.
std::vector<ItemRow> RowsFromDocument(const rapidjson::Value& document) {
  rapidjson::Document scratch;
  std::vector<ItemRow> rows;
  Shape::ForEachItem(Shape::Unwrap(document), [&](const Shape::Item<const rapidjson::Value>& item) {
    ItemRow base{item.component.GetString(), item.group.GetString(), item.key.GetString(), {}, {}};
    const auto schema = FindSchema(base.component, base.group, base.key);
    if (!IsMultiInstance(schema.get(), item.value)) {
      RAPIDJSON_ASSERT(item.value.IsObject());
      base.value = Serialize(item.value);
      rows.push_back(std::move(base));
      return;
    }
    RAPIDJSON_ASSERT(item.value.IsArray());
    std::set<std::string> seen;
    for (const auto& element : item.value.GetArray()) {
      rapidjson::Value instance(element, scratch.GetAllocator());
      ItemRow row = base;
      row.identifier = IdentifyInstance(instance, scratch.GetAllocator(), schema.get(), {});
      if (!seen.insert(row.identifier).second) {
        HoxConfigManager::ThrowException<HoxConfigManager::ConfigManagerException>(
            HoxConfigManager::InvalidKeyValue, item.Path() + " (duplicate instance " + row.identifier + ")");
      }
      row.value = Serialize(instance);
      rows.push_back(std::move(row));
    }
  });
  return rows;
}

constexpr const char* kInsertRow =
    "INSERT INTO config_item (kind, component, config_group, name, identifier, value) VALUES (?, ?, ?, ?, ?, ?)";

// Binds and runs `insert`, a statement that starts with kInsertRow.
void InsertRow(Statement& insert, ConfigKind kind, const ItemRow& row) {
  insert.Bind(1, static_cast<int64_t>(kind))
      .Bind(2, row.component)
      .Bind(3, row.group)
      .Bind(4, row.key)
      .Bind(5, row.identifier)
      .Bind(6, row.value)
      .Run();
}

void ReplaceContents(ConfigKind kind, const std::vector<ItemRow>& rows) {
  auto db = detail::CurrentDatabase(true);
  db->Write("replace configuration", [&](Database& conn) {
    conn.Prepare("DELETE FROM config_item WHERE kind = ?").Bind(1, static_cast<int64_t>(kind)).Run();
    auto insert = conn.Prepare(kInsertRow);
    for (const ItemRow& row : rows) InsertRow(insert, kind, row);
  });
}

void UpsertItem(Database& conn, ConfigKind kind, const ItemRow& row) {
  auto upsert = conn.Prepare(std::string(kInsertRow) +
                             " ON CONFLICT (kind, component, config_group, name, identifier) "
                             "DO UPDATE SET value = excluded.value");
  InsertRow(upsert, kind, row);
}

constexpr const char* kSelectRows =
    "SELECT component, config_group, name, identifier, value, auto_conf_value FROM config_item ";
constexpr const char* kRowOrder = " ORDER BY component, config_group, name, seq";

ConfigMapList ReadRows(Statement& select) {
  ConfigMapList rows;
  while (select.Step()) {
    auto row = std::make_shared<ConfigMap>();
    // Inserted in key order at the end, each value built in its node: one
    // allocation per member, constant-time insertion.
    const auto add = [&](const char* name, int column) {
      const std::string_view text = select.TextView(column);
      row->emplace_hint(row->end(), std::piecewise_construct, std::forward_as_tuple(name),
                        std::forward_as_tuple(text.data() != nullptr ? text.data() : "", text.size()));
    };
    if (!select.IsNull(5)) add(RowColumn::kAutoConfValue, 5);
    add(RowColumn::kComponent, 0);
    add(RowColumn::kGroup, 1);
    add(RowColumn::kIdentifier, 3);
    add(RowColumn::kKey, 2);
    add(RowColumn::kValue, 4);
    rows.push_back(std::move(row));
  }
  return rows;
}

ConfigMapList ReadKind(const std::shared_ptr<DBStore>& db, ConfigKind kind) {
  return detail::AsDatabase(db).Read([&](Database& conn) {
    auto select = conn.Prepare(std::string(kSelectRows) + "WHERE kind = ?" + kRowOrder);
    select.Bind(1, static_cast<int64_t>(kind));
    return ReadRows(select);
  });
}

ConfigMapList ReadKey(const std::shared_ptr<DBStore>& db, ConfigKind kind, const ConfigStoreObjectId& id) {
  return detail::AsDatabase(db).Read([&](Database& conn) {
    std::string sql = std::string(kSelectRows) + "WHERE kind = ? AND component = ? AND config_group = ? AND name = ?";
    if (!id.instanceId.empty()) sql += " AND identifier = ?";
    auto select = conn.Prepare(sql + kRowOrder);
    select.Bind(1, static_cast<int64_t>(kind)).Bind(2, id.component).Bind(3, id.group).Bind(4, id.key);
    if (!id.instanceId.empty()) select.Bind(5, id.instanceId);
    return ReadRows(select);
  });
}

// The item of one key built from its rows: an object for a singleton, an
// array for a multi-instance key (or always an array with `asArray`); null
// when the key has no rows.
rapidjson::Document ItemFromRows(const ConfigMapList& rows, const std::string& component, const std::string& group,
                                 const std::string& key, bool asArray) {
  rapidjson::Document doc;
  if (rows.empty()) return doc;
  const auto schema = FindSchema(component, group, key);
  const bool multi = asArray || (schema ? schema->IsMultiInstance()
                                        : rows.size() > 1 || rows.front()->at(RowColumn::kIdentifier) != "");
  if (multi) doc.SetArray();
  for (const auto& row : rows) {
    rapidjson::Document value = ConfigStoreDocument::CreateDocument(row->at(RowColumn::kValue));
    if (!multi) {
      doc.Swap(value);
      return doc;
    }
    doc.PushBack(rapidjson::Value(value, doc.GetAllocator()), doc.GetAllocator());
  }
  return doc;
}

}  // namespace

ConfigMapList GetConfigContents(const std::shared_ptr<DBStore>& db, ConfigKind kind) { return ReadKind(db, kind); }
ConfigMapList GetUserConfigContents(const std::shared_ptr<DBStore>& db) { return ReadKind(db, ConfigKind::User); }
ConfigMapList GetDesiredUserConfigContents(const std::shared_ptr<DBStore>& db) {
  return ReadKind(db, ConfigKind::Desired);
}
ConfigMapList GetDefaultUserConfigContents(const std::shared_ptr<DBStore>& db) {
  return ReadKind(db, ConfigKind::Default);
}
ConfigMapList GetSmartnicConfiguration(const std::shared_ptr<DBStore>& db) {
  return ReadKind(db, ConfigKind::Smartnic);
}
ConfigMapList GetDesiredSmartnicConfiguration(const std::shared_ptr<DBStore>& db) {
  return ReadKind(db, ConfigKind::DesiredSmartnic);
}

ConfigMapList GetDefaultUserConfigMapList(const ConfigStoreObjectId& id, const std::shared_ptr<DBStore>& db) {
  return ReadKey(db, ConfigKind::Default, id);
}

ConfigMapList GetConfigMapList(const std::shared_ptr<DBStore>& db, ConfigKind kind, const ConfigStoreObjectId& id) {
  return ReadKey(db, kind, ConfigStoreObjectId(id.component, id.group, id.key));
}

void ForEachConfigRow(const std::shared_ptr<DBStore>& db, ConfigKind kind,
                      const std::function<void(const ConfigRow&)>& visit) {
  detail::AsDatabase(db).Read([&](Database& conn) {
    auto select = conn.Prepare(std::string(kSelectRows) + "WHERE kind = ?" + kRowOrder);
    select.Bind(1, static_cast<int64_t>(kind));
    // One row object for the whole visit: its strings keep their capacity.
    ConfigRow row;
    const auto text = [&select](int column, std::string& out) {
      const std::string_view view = select.TextView(column);
      out.assign(view.data() != nullptr ? view.data() : "", view.size());
    };
    while (select.Step()) {
      text(0, row.component);
      text(1, row.group);
      text(2, row.key);
      text(3, row.identifier);
      text(4, row.value);
      row.hasAutoConfValue = !select.IsNull(5);
      if (row.hasAutoConfValue) {
        text(5, row.autoConfValue);
      } else {
        row.autoConfValue.clear();
      }
      visit(row);
    }
  });
}

void SetDesiredUserConfig(rapidjson::Document& document) {
  ReplaceContents(ConfigKind::Desired, RowsFromDocument(document));
}

void SetDesiredSmartnicConfiguration(rapidjson::Document& document) {
  ReplaceContents(ConfigKind::DesiredSmartnic, RowsFromDocument(document));
}

void ImportConfiguration(ConfigKind kind, const rapidjson::Value& document) {
  ReplaceContents(kind, RowsFromDocument(document));
}

void ApplyUserConfigChanges(const std::vector<UserConfigChange>& changes) {
  // Every change is checked and turned into a row before the first write.
  struct Planned {
    bool remove;
    ItemRow row;
  };
  std::vector<Planned> plan;
  rapidjson::Document scratch;
  for (const UserConfigChange& change : changes) {
    const ConfigStoreObjectId& id = change.id;
    Planned planned{change.action == "DELETE", {id.component, id.group, id.key, id.instanceId, {}}};
    if (!planned.remove && change.action != "ADD" && change.action != "SET") {
      const std::string text = "ConfigStore error: unknown change action \"" + change.action + "\"";
      throw ConfigStoreException(2000, text.c_str());
    }
    const auto schema = FindSchema(id.component, id.group, id.key);
    const bool multi = schema ? schema->IsMultiInstance() : !id.instanceId.empty();
    if (!planned.remove || (multi && id.instanceId.empty() && !change.value.empty())) {
      rapidjson::Document value = ConfigStoreDocument::CreateDocument(change.value);
      RAPIDJSON_ASSERT(value.IsObject());
      if (multi && schema) {
        planned.row.identifier = IdentifyInstance(value, value.GetAllocator(), schema.get(), id.instanceId);
      }
      planned.row.value = Serialize(value);
    }
    plan.push_back(std::move(planned));
  }
  auto db = detail::CurrentDatabase(true);
  db->Write("apply user configuration changes", [&](Database& conn) {
    for (const Planned& planned : plan) {
      if (!planned.remove) {
        UpsertItem(conn, ConfigKind::User, planned.row);
        continue;
      }
      conn.Prepare(
              "DELETE FROM config_item WHERE kind = ? AND component = ? AND config_group = ? AND name = ? "
              "AND identifier = ?")
          .Bind(1, static_cast<int64_t>(ConfigKind::User))
          .Bind(2, planned.row.component)
          .Bind(3, planned.row.group)
          .Bind(4, planned.row.key)
          .Bind(5, planned.row.identifier)
          .Run();
    }
  });
}

void SetAutoConfValue(ConfigKind kind, const ConfigStoreObjectId& id, const std::string& autoConfValue) {
  if (!autoConfValue.empty()) {
    rapidjson::Document check = ConfigStoreDocument::CreateDocument(autoConfValue);
    RAPIDJSON_ASSERT(check.IsObject());
  }
  auto db = detail::CurrentDatabase(true);
  db->Write("set auto-configuration value", [&](Database& conn) {
    auto update = conn.Prepare(
        "UPDATE config_item SET auto_conf_value = ? WHERE kind = ? AND component = ? AND config_group = ? "
        "AND name = ? AND identifier = ?");
    if (autoConfValue.empty()) {
      update.BindNull(1);
    } else {
      update.Bind(1, autoConfValue);
    }
    update.Bind(2, static_cast<int64_t>(kind)).Bind(3, id.component).Bind(4, id.group).Bind(5, id.key);
    update.Bind(6, id.instanceId).Run();
  });
}

void ProcessDesiredObject(rapidjson::MemoryPoolAllocator<>& allocator, const std::shared_ptr<DBStore>& db,
                          const std::string& component, const std::string& group, const std::string& key,
                          const std::shared_ptr<HoxSchemaStore::SchemaObject>& schema,
                          const rapidjson::Value& value) {
  RAPIDJSON_ASSERT(value.IsObject());
  rapidjson::Value copy(value, allocator);
  ItemRow row{component, group, key, {}, {}};
  if (schema && schema->IsMultiInstance()) row.identifier = IdentifyInstance(copy, allocator, schema.get(), {});
  row.value = Serialize(copy);
  detail::AsDatabase(db).Write("stage desired object",
                               [&](Database& conn) { UpsertItem(conn, ConfigKind::Desired, row); });
}

void DeleteConfigRows(const std::shared_ptr<DBStore>& db, ConfigKind kind, const ConfigStoreObjectId& id) {
  detail::AsDatabase(db).Write("delete configuration rows", [&](Database& conn) {
    std::string sql = "DELETE FROM config_item WHERE kind = ? AND component = ? AND config_group = ? AND name = ?";
    if (!id.instanceId.empty()) sql += " AND identifier = ?";
    auto remove = conn.Prepare(sql);
    remove.Bind(1, static_cast<int64_t>(kind)).Bind(2, id.component).Bind(3, id.group).Bind(4, id.key);
    if (!id.instanceId.empty()) remove.Bind(5, id.instanceId);
    remove.Run();
  });
}

rapidjson::Document GetCurrentConfigInternal(const std::shared_ptr<DBStore>& db, const std::string& component,
                                             const std::string& group, const std::string& key) {
  return ItemFromRows(ReadKey(db, ConfigKind::User, {component, group, key}), component, group, key, false);
}

rapidjson::Document GetDefaultUserConfigInternal(const std::shared_ptr<DBStore>& db, const std::string& component,
                                                 const std::string& group, const std::string& key) {
  return ItemFromRows(ReadKey(db, ConfigKind::Default, {component, group, key}), component, group, key, false);
}

rapidjson::Document GetDefaultUserConfigInstancesInternal(const std::shared_ptr<DBStore>& db,
                                                          const std::string& component, const std::string& group,
                                                          const std::string& key) {
  return ItemFromRows(ReadKey(db, ConfigKind::Default, {component, group, key}), component, group, key, true);
}

}  // namespace HoxConfigStore
