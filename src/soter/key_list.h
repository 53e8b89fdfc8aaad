// A list of values under 16-bit keys, newest first. It owns its nodes; what becomes of a value is told by a callback.
#ifndef KEYMASTER_SOTER_KEY_LIST_H_
#define KEYMASTER_SOTER_KEY_LIST_H_

#include <cstdint>

namespace keymaster {

using key_list_free = void (*)(void* value);

struct key_list_node {
  uint16_t key = 0;
  void* value = nullptr;
  key_list_node* previous = nullptr;
  key_list_node* next = nullptr;
};

struct key_list {
  uint32_t count = 0;
  key_list_node* head = nullptr;
  key_list_free free_value = nullptr;
};

/// key_list_create makes an empty list whose values are given back through `free_value`. Null: out of memory.
[[nodiscard]] key_list* key_list_create(key_list_free free_value);

/// key_list_destroy gives back every value, and frees the list.
void key_list_destroy(key_list* list);

/// key_list_add puts a value in front of the others; the list owns it from then on. -1, and the value stays the
/// caller's: the key is taken, or out of memory.
[[nodiscard]] int key_list_add(key_list* list, uint16_t key, void* value);

/// key_list_get finds the value of a key; it stays the list's. -1: there is none, and `*value` is as it was.
[[nodiscard]] int key_list_get(const key_list* list, uint16_t key, void** value);

/// key_list_contains tells whether the key is taken.
[[nodiscard]] bool key_list_contains(const key_list* list, uint16_t key);

/// key_list_edit replaces the value of a key. The old value is not given back: it is the caller's again. -1: no such
/// key.
[[nodiscard]] int key_list_edit(key_list* list, uint16_t key, void* value);

/// key_list_remove takes a key out and gives its value back. -1: no such key.
[[nodiscard]] int key_list_remove(key_list* list, uint16_t key);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_KEY_LIST_H_
