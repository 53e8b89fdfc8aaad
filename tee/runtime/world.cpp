#include "tee/runtime/world.h"

#include <openssl/rand.h>

#include <algorithm>
#include <stdexcept>

#include "tee/runtime/instance_scope.h"
#include "tee/storage/object_store.h"

namespace hosted_tee {
namespace {

std::vector<std::filesystem::path> folders_of(const world_options& options) {
  if (options.ta_folder.empty()) return default_ta_folders();
  return {options.ta_folder};
}

void draw_boot_seed(std::array<std::uint8_t, 32>& seed) {
  if (RAND_bytes(seed.data(), static_cast<int>(seed.size())) != 1) {
    throw world_error(world_fault::io, "libcrypto has no random bytes");
  }
}

store_options private_options(const step_observer& step) {
  return {"private", false, step};
}
store_options rpmb_options(const step_observer& step) {
  return {"rpmb", true, step};
}

std::unique_ptr<object_store> open_store(const state_folder& folder, const store_options& options) {
  const std::string file = (folder.path() / options.name).string() + ".db: ";
  try {
    return std::make_unique<object_store>(folder.path(), folder.device().key, options);
  } catch (const database_failure& failure) {
    throw world_error(failure.damaged() ? world_fault::corrupt : world_fault::io, file + failure.what());
  } catch (const call_failure&) {
    throw world_error(world_fault::io, file + "can't be written");
  } catch (const std::system_error& error) {
    throw world_error(world_fault::io, error.what());
  }
}

object_key key_of(const TEE_UUID& ta, std::string_view id) {
  return {to_bytes(ta), std::string(id)};
}

void add_holdings(const instance& live, accounting& sum) {
  sum.heap_bytes += live.heap.bytes();
  sum.heap_blocks += live.heap.blocks();
  sum.heap_peak += live.heap.peak();
  for (const auto& [handle, item] : live.objects) {
    ++(item->is_persistent() ? sum.persistent_objects : sum.transient_objects);
  }
  sum.operations += static_cast<std::uint32_t>(live.operations.size());
}

}  // namespace

world::world(const world_options& options)
    : folder_(options.state, options.at_storage_step,
              [&](const device_record& made) {
                object_store::prepare(options.state, made.key, rpmb_options(options.at_storage_step));
              }),
      heap_limit_(options.heap_limit) {
  const device_settings& settings = folder_.settings();
  device_.trace.keep_up_to(options.kept_trace);
  device_.faults.at_storage_step(options.at_storage_step);
  device_.id = options.device_id.value_or(settings.device_id.value_or(folder_.device().id));
  if (options.boot_seed) {
    device_.boot_seed = *options.boot_seed;
  } else {
    draw_boot_seed(device_.boot_seed);
  }
  device_.text_properties = settings.text_properties;
  device_.other_tas = this;
  device_.ta_folders = folders_of(options);
  const auto step = [this](std::string_view reached) { device_.faults.on_storage_step(reached); };
  device_.private_store = open_store(folder_, private_options(step));
  if (options.rpmb.value_or(settings.rpmb.value_or(true))) {
    device_.rpmb_store = open_store(folder_, rpmb_options(step));
  }
}

world::~world() = default;

bool world::has_rpmb() const {
  const std::scoped_lock lock(mutex_);
  try {
    return device_.rpmb_store != nullptr && device_.rpmb_store->check() == TEE_SUCCESS;
  } catch (const call_failure&) {
    return false;  // what cannot be read has not passed its check
  }
}

accounting world::account(const TEE_UUID& ta) const {
  const std::scoped_lock lock(mutex_);
  accounting sum;
  for (const auto& live : instances_) {
    if (same_uuid(live->uuid, ta)) add_holdings(*live, sum);
  }
  return sum;
}

world_status world::status() const {
  const std::scoped_lock lock(mutex_);
  world_status now;
  now.sessions = static_cast<std::uint32_t>(sessions_.size());
  now.commands = commands_;
  now.trace_total = device_.trace.total();
  now.trace_kept = static_cast<std::uint32_t>(device_.trace.lines().size());
  for (const auto& live : instances_) {
    instance_status& entry = now.instances.emplace_back();
    entry.ta = live->uuid;
    entry.sessions = live->open_sessions;
    entry.heap_limit = live->heap.limit();
    add_holdings(*live, entry.held);
  }
  return now;
}

std::vector<numbered_line> world::trace_lines(std::uint64_t from, std::size_t limit) const {
  const std::scoped_lock lock(mutex_);
  const auto& lines = device_.trace.lines();
  const std::uint64_t oldest = device_.trace.total() - lines.size();
  std::vector<numbered_line> out;
  for (std::uint64_t number = std::max(from, oldest); number < device_.trace.total() && out.size() < limit; ++number) {
    out.push_back({number, lines[static_cast<std::size_t>(number - oldest)]});
  }
  return out;
}

bool world::has_instance(const TEE_UUID& ta) const {
  const std::scoped_lock lock(mutex_);
  return std::any_of(instances_.begin(), instances_.end(), [&](const auto& i) { return same_uuid(i->uuid, ta); });
}

void world::set_free_inspector(std::function<void(std::span<const std::uint8_t>)> inspector) {
  const std::scoped_lock lock(mutex_);
  free_inspector_ = std::move(inspector);
  for (const auto& live : instances_) live->heap.set_inspector(free_inspector_);
}

object_store& world::storage(std::uint32_t storage) const {
  object_store* store = device_.store(storage);
  if (store == nullptr) throw std::invalid_argument("the device has no such storage");
  return *store;
}

std::optional<std::string> world::read_object(const TEE_UUID& ta, std::uint32_t storage_id, std::string_view id) {
  const std::scoped_lock lock(mutex_);
  const auto data = storage(storage_id).read(key_of(ta, id));
  if (!data) return std::nullopt;
  return std::string(data->begin(), data->end());
}

void world::write_object(const TEE_UUID& ta, std::uint32_t storage_id, std::string_view id, std::string_view data) {
  const std::scoped_lock lock(mutex_);
  storage(storage_id).write(key_of(ta, id), {reinterpret_cast<const std::uint8_t*>(data.data()), data.size()});
}

void world::delete_object(const TEE_UUID& ta, std::uint32_t storage_id, std::string_view id) {
  const std::scoped_lock lock(mutex_);
  storage(storage_id).remove(key_of(ta, id));
}

void world::trace_problem(const std::string& text) {
  device_.trace.add({"TEE", trace_level::error, "secure_world", 0, text});
}

}  // namespace hosted_tee
