// One key's schema file, read and checked: the SchemaObject implementation
// that the schema store hands out. The file format is described in
// docs/schema-store.md.
//
// A KeySchema is immutable once built and may be shared between threads;
// its prepared form for validation is built on first use, once.
#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <hoxcm/schema_store.h>

namespace JsonValidator::detail {
struct PreparedSchema;
}

namespace HoxSchemaStore::detail {

class KeySchema final : public SchemaObject {
 public:
  // Everything a schema file declares, already checked.
  struct Definition {
    SchemaObjectId id;
    bool multiInstance = false;
    std::string identity;
    bool defaultUserConfig = false;
    bool mutableDefault = false;
    bool hostSpecific = false;
    std::vector<std::string> solutionUsers;
    std::vector<std::string> solutionInstanceIds;
    std::vector<std::string> rebootOperations;
    std::vector<std::string> maintenanceModeOperations;
    bool rebootPropertyLevel = false;
    bool maintenanceModePropertyLevel = false;
  };

  using Pool = rapidjson::MemoryPoolAllocator<>;

  // `instanceSchema`, the schema of one instance (of the singleton), is
  // moved into the key's JSON schema; it and every value it holds live in
  // `pool`, which the key keeps: nothing is copied.
  KeySchema(Definition definition, std::unique_ptr<Pool> pool, rapidjson::Value& instanceSchema);
  ~KeySchema() override;
  KeySchema(const KeySchema&) = delete;
  KeySchema& operator=(const KeySchema&) = delete;

  const SchemaObjectId& GetId() const override { return def_.id; }
  bool IsMultiInstance() const override { return def_.multiInstance; }
  const std::string& GetIdentityMember() const override { return def_.identity; }
  bool HasDefaultUserConfig() const override { return def_.defaultUserConfig; }
  bool IsMutableDefault() const override { return def_.mutableDefault; }
  const std::vector<std::string>& GetSolutionUserNames() const override { return def_.solutionUsers; }
  const std::vector<std::string>& GetSolutionInstanceIds() const override { return def_.solutionInstanceIds; }
  int GetRebootOperations(std::vector<std::string>& operations, bool& propertyLevel) const override;
  int GetMaintenanceModeOperations(std::vector<std::string>& operations, bool& propertyLevel) const override;
  const rapidjson::Value& GetJsonSchema() const override { return schema_; }
  const rapidjson::Value& GetInstanceSchema() const override { return *instance_; }

  bool IsHostSpecific() const override { return def_.hostSpecific; }

  const Definition& definition() const { return def_; }

  // The key's schema compiled for validating host documents: built by the
  // first caller (others wait for it) and kept for the key's life, so it is
  // never older than the schema it is compiled from. Throws std::exception
  // when the engine refuses the schema, and the next call tries again.
  const JsonValidator::detail::PreparedSchema& Prepared() const;

 private:
  const Definition def_;
  // Sized to the file, so that a small key holds a small pool.
  const std::unique_ptr<Pool> pool_;
  rapidjson::Value schema_;
  const rapidjson::Value* instance_;
  mutable std::once_flag preparedOnce_;
  mutable std::unique_ptr<const JsonValidator::detail::PreparedSchema> prepared_;
};

// Reads and checks the schema file at `path` for the key `id`. Null with a
// reason in `error` when the file is unreadable or malformed.
std::shared_ptr<KeySchema> LoadSchemaFile(const std::string& path, const SchemaObjectId& id, std::string& error);

// Checks `schema` (a JSON schema) for use by the validator: it must be an
// object that the validator can compile, with valid regular expressions.
// Empty when usable, else the reason.
std::string CheckJsonSchema(const rapidjson::Value& schema);

}  // namespace HoxSchemaStore::detail
