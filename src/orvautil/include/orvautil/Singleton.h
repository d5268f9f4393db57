#pragma once

#include <boost/thread/lock_guard.hpp>
#include <boost/thread/mutex.hpp>

#include <memory>

namespace orva::util {

/// Access to the one process-wide T, which is created on first use and never deleted.
template <typename T>
class Singleton {
public:
  /// Returns the instance; T is default-constructed by the first call. Any thread.
  /// Throws boost::thread_resource_error or boost::lock_error when locking fails
  /// (boost::mutex itself retries a lock that a signal interrupted), and what T throws.
  static T* Instance() {
    static boost::mutex mutex;
    const boost::lock_guard<boost::mutex> lock(mutex);
    if (instance == nullptr) {
      instance = std::make_unique<T>().release();
    }
    return instance;
  }

private:
  inline static T* instance = nullptr;
};

} // namespace orva::util
