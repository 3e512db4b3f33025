#include <hoxcm/config_store.h>

namespace HoxConfigStore {

bool ConfigStoreDocument::ValueExists(const rapidjson::Value& object, const char* member) {
  return object.IsObject() && member != nullptr && object.HasMember(member);
}

}  // namespace HoxConfigStore
