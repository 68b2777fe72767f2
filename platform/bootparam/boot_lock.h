// platform/bootparam/boot_lock.h: the lock of U-Boot's tools; internal.
#pragma once

// Holds the lock until it is given back or goes out of scope. libubootenv takes it by itself,
// through a description of its own, for which this one has to be given back.
class boot_lock {
  public:
    boot_lock() = default;
    ~boot_lock() { give_back(); }
    boot_lock(const boot_lock &) = delete;
    boot_lock &operator=(const boot_lock &) = delete;

    // Waits for at most 3 seconds: -EBUSY; or another negative errno value. libubootenv itself
    // would wait for ever, and would go on without a lock where the file cannot be opened.
    int take();

    // Leaves errno alone.
    void give_back();

  private:
    int fd_ = -1;
};
