#include "soter/key_list.h"

#include "platform/bytes.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

// What the records take on the 32-bit processor that the messages speak of.
constexpr int list_size = 12;
constexpr int node_size = 16;

key_list_node* find(const key_list* list, uint16_t key) {
  key_list_node* node = list->head;
  while (node != nullptr && node->key != key) node = node->next;
  return node;
}

void unlink(key_list* list, const key_list_node* node) {
  (node->previous == nullptr ? list->head : node->previous->next) = node->next;
  if (node->next != nullptr) node->next->previous = node->previous;
  --list->count;
}

void remove_node(key_list* list, key_list_node* node) {
  unlink(list, node);
  if (list->free_value != nullptr) list->free_value(node->value);
  delete_record(node);
}

}  // namespace

key_list* key_list_create(key_list_free free_value) {
  auto* const list = new_record<key_list>();
  if (list == nullptr) {
    TRACE_ERROR("Out of memory, need %dB", list_size);
    return nullptr;
  }
  list->free_value = free_value;
  return list;
}

void key_list_destroy(key_list* list) {
  while (list->head != nullptr) remove_node(list, list->head);
  delete_record(list);
}

int key_list_add(key_list* list, uint16_t key, void* value) {
  if (find(list, key) != nullptr) return -1;
  auto* const node = new_record<key_list_node>();
  if (node == nullptr) {
    TRACE_ERROR("Out of memory, need %dB", node_size);
    return -1;
  }
  *node = {key, value, nullptr, list->head};
  if (list->head != nullptr) list->head->previous = node;
  list->head = node;
  ++list->count;
  return 0;
}

int key_list_get(const key_list* list, uint16_t key, void** value) {
  const key_list_node* const node = find(list, key);
  if (node == nullptr) return -1;
  *value = node->value;
  return 0;
}

bool key_list_contains(const key_list* list, uint16_t key) {
  return find(list, key) != nullptr;
}

int key_list_edit(key_list* list, uint16_t key, void* value) {
  key_list_node* const node = find(list, key);
  if (node == nullptr) return -1;
  node->value = value;
  return 0;
}

int key_list_remove(key_list* list, uint16_t key) {
  key_list_node* const node = find(list, key);
  if (node == nullptr) return -1;
  remove_node(list, node);
  return 0;
}

}  // namespace keymaster
