#include "tee/companions/provisioning/vault.h"

#include "tee/companions/common/stored_object.h"
#include "tee/companions/provisioning/provisioning_protocol.h"

namespace keymaster::provisioning {
namespace {

constexpr std::string_view lock_name = "quil.lock";

/// Sets a bit of the mask when there is an object of this name.
TEE_Result mark(std::string_view name, status_t bit, uint32_t* status) {
  bool there = false;
  const TEE_Result result = companion::is_stored(name, &there);
  if (there) *status |= bit;
  return result;
}

struct named_item {
  std::string_view name;
  status_t bit;
};
constexpr named_item named_items[] = {{key_name, STATUS_KEY}, {data_name, STATUS_DATA}, {lock_name, STATUS_LOCKED}};

struct property_item {
  quil_property_request property;
  status_t bit;
};
constexpr property_item property_items[] = {{QUIL_PROPERTY_SOTER, STATUS_SOTER_PROPERTIES},
                                            {QUIL_PROPERTY_CPU_ID, STATUS_CPU_ID},
                                            {QUIL_PROPERTY_DEVICE_ID, STATUS_DEVICE_ID}};

}  // namespace

companion::object_name property_name(const quil_property_request& property) {
  companion::object_name name{"quil.prop."};
  name.add_hex(property.group).add(".").add_hex(property.item);
  return name;
}

TEE_Result is_locked(bool* locked) {
  const TEE_Result result = companion::is_stored(lock_name, locked);
  if (result != TEE_SUCCESS) *locked = true;
  return result;
}

TEE_Result lock() {
  bool locked = false;
  if (TEE_Result r = is_locked(&locked); r != TEE_SUCCESS) return r;
  // That it is there is all that counts.
  constexpr uint8_t content[] = {1};
  return locked ? TEE_SUCCESS : companion::write_stored(lock_name, content);
}

TEE_Result find_status(uint32_t* status) {
  uint32_t found = 0;
  for (const named_item& item : named_items) {
    if (TEE_Result r = mark(item.name, item.bit, &found); r != TEE_SUCCESS) return r;
  }
  for (const property_item& item : property_items) {
    if (TEE_Result r = mark(property_name(item.property).view(), item.bit, &found); r != TEE_SUCCESS) return r;
  }
  *status = found;
  return TEE_SUCCESS;
}

}  // namespace keymaster::provisioning
