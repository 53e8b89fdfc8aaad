// Transient object functions (section 5.6 of the API).
#include <algorithm>
#include <memory>

#include "tee/crypto/transient_object.h"

using namespace hosted_tee;  // NOLINT(google-build-using-namespace): the file holds nothing but the API's C functions

namespace {

/// empty_object is a transient object that a key may be put into.
transient_object& empty_object(const instance& self, TEE_ObjectHandle handle) {
  transient_object& found = find_transient_object(self, handle);
  panic_unless(!found.holds_key(), "the object already holds a key");
  return found;
}

/// attributes_for picks from `source` the attributes that an object of `type` is made of. They refer to the source.
std::vector<TEE_Attribute> attributes_for(const object_type& type, const key_material& source) {
  std::vector<TEE_Attribute> picked;
  const auto pick = [&](std::uint32_t id) {
    const stored_attribute* const found = source.find(id);
    if (found == nullptr) return;
    TEE_Attribute& attribute = picked.emplace_back();
    attribute.attributeID = id;
    if (is_value_attribute(id)) {
      attribute.content.value = {.a = found->a, .b = found->b};
    } else {
      // The API's attribute has no const form; what is made from it only reads.
      attribute.content.ref.buffer = const_cast<std::uint8_t*>(found->bytes.data());
      attribute.content.ref.length = static_cast<std::uint32_t>(found->bytes.size());
    }
  };
  std::for_each(type.required.begin(), type.required.end(), pick);
  std::for_each(type.together.begin(), type.together.end(), pick);
  return picked;
}

void populate(transient_object& destination, const attribute_view& given) {
  const object_type& type = destination.type();
  panic_unless(given.is_made_of(type.required, type.together), "missing or foreign attributes");
  destination.set_material(type.from_attributes(type, destination.max_bits(), given));
}

}  // namespace

extern "C" {

TEE_Result TEE_AllocateTransientObject(TEE_ObjectType objectType, uint32_t maxKeySize, TEE_ObjectHandle* object) {
  if (object != nullptr) *object = TEE_HANDLE_NULL;
  return crypto_call(__func__, nullptr, [&](instance& self) {
    panic_unless(object != nullptr, "no place for the handle");
    const object_type* const type = find_object_type(objectType);
    refuse_unless(type != nullptr && type->has_size(maxKeySize), TEE_ERROR_NOT_SUPPORTED);
    *object = self.objects.insert(std::make_unique<transient_object>(*type, maxKeySize));
  });
}

void TEE_FreeTransientObject(TEE_ObjectHandle object) {
  platform_call_void(__func__, [&](instance& self) {
    if (object == TEE_HANDLE_NULL) return;
    (void)find_transient_object(self, object);
    self.objects.erase(object);
  });
}

void TEE_ResetTransientObject(TEE_ObjectHandle object) {
  platform_call_void(__func__, [&](instance& self) { find_transient_object(self, object).reset(); });
}

TEE_Result TEE_PopulateTransientObject(TEE_ObjectHandle object, const TEE_Attribute* attrs, uint32_t attrCount) {
  return crypto_call(__func__, nullptr,
                     [&](instance& self) { populate(empty_object(self, object), attribute_view(attrs, attrCount)); });
}

void TEE_InitRefAttribute(TEE_Attribute* attr, uint32_t attributeID, const void* buffer, uint32_t length) {
  platform_call_void(__func__, [&](instance& /*self*/) {
    panic_unless(attr != nullptr && !is_value_attribute(attributeID), "not a buffer attribute");
    attr->attributeID = attributeID;
    attr->content.ref.buffer = const_cast<void*>(buffer);  // the API's attribute has no const form
    attr->content.ref.length = length;
  });
}

void TEE_InitValueAttribute(TEE_Attribute* attr, uint32_t attributeID, uint32_t a, uint32_t b) {
  platform_call_void(__func__, [&](instance& /*self*/) {
    panic_unless(attr != nullptr && is_value_attribute(attributeID), "not a value attribute");
    attr->attributeID = attributeID;
    attr->content.value = {.a = a, .b = b};
  });
}

TEE_Result TEE_CopyObjectAttributes1(TEE_ObjectHandle destObject, TEE_ObjectHandle srcObject) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    transient_object& destination = empty_object(self, destObject);
    refuse_unless(!find_object(self, srcObject).is_persistent(), TEE_ERROR_NOT_SUPPORTED);
    const transient_object& source = find_transient_object(self, srcObject);
    panic_unless(source.holds_key(), "the source holds no key");
    panic_unless(source.material().bits <= destination.max_bits(), "the source is larger than the destination");
    // A key pair also fills an object of its public type; any other mixture lacks attributes, or has foreign ones.
    const std::vector<TEE_Attribute> picked = attributes_for(destination.type(), source.material());
    panic_unless((source.type().id & 0xFF) == (destination.type().id & 0xFF), "objects of different kinds");
    populate(destination, attribute_view(picked.data(), static_cast<std::uint32_t>(picked.size())));
    destination.restrict_usage(source.usage());
  });
}

TEE_Result TEE_GenerateKey(TEE_ObjectHandle object, uint32_t keySize, const TEE_Attribute* params,
                           uint32_t paramCount) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    transient_object& destination = empty_object(self, object);
    const object_type& type = destination.type();
    panic_unless(type.generate != nullptr, "a public key cannot be generated");
    refuse_unless(type.has_size(keySize) && keySize <= destination.max_bits(), TEE_ERROR_BAD_PARAMETERS);
    const attribute_view parameters(params, paramCount);
    const auto required = type.parameters_required ? type.parameters : std::span<const std::uint32_t>();
    const auto allowed = type.parameters_required ? std::span<const std::uint32_t>() : type.parameters;
    panic_unless(parameters.is_made_of(required, allowed), "missing or foreign parameters of the generation");
    destination.set_material(type.generate(keySize, parameters));
  });
}

}  // extern "C"
