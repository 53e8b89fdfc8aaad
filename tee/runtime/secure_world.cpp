// The running devices of this process, by their folders.
#include "tee/runtime/secure_world.h"

#include <condition_variable>
#include <map>
#include <mutex>
#include <utility>

#include "tee/runtime/world.h"

namespace hosted_tee {
namespace {

// A device has an entry from before it starts until after it has ended, so that a thread that comes in between waits
// rather than finds the folder locked by its own process.
class running_devices {
 public:
  static running_devices& instance() {
    static auto* const devices = new running_devices;  // never destroyed: a device may end after main
    return *devices;
  }

  std::shared_ptr<secure_world> find(const std::string& folder) {
    const std::scoped_lock lock(mutex_);
    const auto found = devices_.find(folder);
    return found == devices_.end() ? nullptr : found->second.lock();
  }

  std::shared_ptr<secure_world> open(const std::string& folder, const world_options& options, bool share) {
    std::unique_lock lock(mutex_);
    for (auto found = devices_.find(folder); found != devices_.end(); found = devices_.find(folder)) {
      if (auto running = found->second.lock()) {
        if (share) return running;
        throw world_error(world_fault::busy, folder + " is in use by this process");
      }
      changed_.wait(lock);
    }
    // Whatever can be refused for want of memory comes first: once the device runs, its end takes the mutex.
    const auto owner = std::make_shared<device_owner>(folder);
    std::weak_ptr<world>& entry = devices_[folder];
    try {
      owner->running = std::make_unique<world>(options);
    } catch (...) {
      devices_.erase(folder);
      throw;
    }
    const std::shared_ptr<world> started(owner, owner->running.get());
    entry = started;
    return started;
  }

 private:
  // Ends its device first, and the device's entry then.
  struct device_owner {
    explicit device_owner(std::string name) : folder(std::move(name)) {}
    ~device_owner() {
      if (running == nullptr) return;
      running.reset();
      instance().forget(folder);
    }
    device_owner(const device_owner&) = delete;
    device_owner& operator=(const device_owner&) = delete;

    std::string folder;
    std::unique_ptr<world> running;
  };

  void forget(const std::string& folder) {
    {
      const std::scoped_lock lock(mutex_);
      devices_.erase(folder);
    }
    changed_.notify_all();
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::map<std::string, std::weak_ptr<world>> devices_;
};

// One name for a folder, whether it exists yet or not.
std::filesystem::path folder_name(const std::filesystem::path& state) {
  try {
    const std::filesystem::path name = std::filesystem::weakly_canonical(std::filesystem::absolute(state));
    return name.has_filename() ? name : name.parent_path();
  } catch (const std::filesystem::filesystem_error& error) {
    throw world_error(world_fault::io, error.what());
  }
}

std::shared_ptr<secure_world> open_device(world_options options, bool share) {
  options.state = folder_name(options.state);
  const std::string folder = options.state.string();
  return running_devices::instance().open(folder, options, share);
}

}  // namespace

std::shared_ptr<secure_world> secure_world::open(const world_options& options) {
  return open_device(options, false);
}

std::shared_ptr<secure_world> secure_world::open_shared(const world_options& options) {
  return open_device(options, true);
}

std::shared_ptr<secure_world> secure_world::find_open(const std::filesystem::path& state) {
  return running_devices::instance().find(folder_name(state).string());
}

}  // namespace hosted_tee
