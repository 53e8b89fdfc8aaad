#include "tests/support/device_fixture.h"

#include <cstdlib>
#include <stdexcept>

namespace testing_support {

temporary_folder::temporary_folder() {
  std::string name = (std::filesystem::temp_directory_path() / "keymaster-test-XXXXXX").string();
  if (mkdtemp(name.data()) == nullptr) throw std::runtime_error("mkdtemp failed");
  path_ = name;
}

temporary_folder::~temporary_folder() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

device::device(bool rpmb) {
  start(rpmb);
  open_session();
}

void device::start(bool rpmb) {
  hosted_tee::world_options options;
  options.state = folder_.path() / "state";
  options.rpmb = rpmb;
  world_ = hosted_tee::secure_world::open_shared(options);
  world_->clock().set_system(start_system);
  world_->clock().set_ree(start_ree);
}

void device::open_session() {
  client_ = another_client();
}

std::unique_ptr<ta_client> device::another_client() const {
  return std::make_unique<ta_client>(context_name());
}

void device::restart(bool rpmb, bool open) {
  client_.reset();
  world_.reset();
  start(rpmb);
  if (open) open_session();
}

void DeviceTest::expect_same(const hosted_tee::accounting& before) {
  const hosted_tee::accounting now = tee.accounting();
  EXPECT_EQ(now.heap_bytes, before.heap_bytes);
  EXPECT_EQ(now.heap_blocks, before.heap_blocks);
  EXPECT_EQ(now.transient_objects, before.transient_objects);
  EXPECT_EQ(now.persistent_objects, before.persistent_objects);
  EXPECT_EQ(now.operations, before.operations);
}

}  // namespace testing_support
