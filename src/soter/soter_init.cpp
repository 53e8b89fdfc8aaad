#include "soter/soter_init.h"

#include "soter/finger_id.h"

namespace keymaster {

constinit attk_key_pair_t attk_key_pair = {};
constinit soter_prop_set_t soter_prop_set = {};

namespace {

constinit bool ready = false;

void free_resources() {
  free_soter_prop_set(&soter_prop_set);
  free_soter_key(&attk_key_pair);
}

}  // namespace

// Nothing is freed: the blocks of an instance that ended went with its heap.
void soter_start() {
  ready = false;
  attk_key_pair = {};
  soter_prop_set = {};
  soter_set_fid(0, 0);
}

TEE_Result soter_ensure_ready() {
  return ready ? TEE_SUCCESS : soter_init_resources();
}

TEE_Result soter_init_resources() {
  TEE_Result result = init_soter_key(&attk_key_pair);
  if (result == TEE_SUCCESS) result = init_soter_prop_set(&soter_prop_set);
  if (result != TEE_SUCCESS) {
    free_resources();
    return result;
  }
  ready = true;
  return TEE_SUCCESS;
}

bool soter_ready() {
  return ready;
}

void soter_release_resources() {
  ready = false;
  free_resources();
}

}  // namespace keymaster
