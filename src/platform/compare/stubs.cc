#include <stdexcept>

#include <hoxcm/config_store.h>

namespace HoxConfigStore {

bool ConfigStoreDocument::IsEqualValue(const rapidjson::Value&, const rapidjson::Value&, const rapidjson::Value&) {
  throw std::logic_error("not implemented");
}
std::size_t ConfigStoreDocument::HashValue(const rapidjson::Value&, const rapidjson::Value&) {
  throw std::logic_error("not implemented");
}
bool ConfigStoreDocument::IsEqualPrimitiveArray(const rapidjson::Value&, const rapidjson::Value&) {
  throw std::logic_error("not implemented");
}
std::string ConfigStoreDocument::RedactAndSerializeValue(const rapidjson::Value&, const rapidjson::Value&) {
  throw std::logic_error("not implemented");
}

}  // namespace HoxConfigStore
