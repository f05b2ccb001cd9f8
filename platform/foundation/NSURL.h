#pragma once

#include <atomic>
#include <memory>
#include <string>
#include <utility>

namespace skein {

class NSURL;

// A URL reference; null is nil.
using NSURLPtr = std::shared_ptr<NSURL>;

// The location of a file: an absolute path of bytes, never normalised; or, made from a
// string, an address of another kind. Immutable but for the physical property that a
// category may attach. Any thread.
class NSURL {
 public:
  static NSURLPtr fileURLWithPath(std::string path) {
    return std::make_shared<NSURL>(std::move(path));
  }
  // URLWithString: an address such as "https://...", kept as it is; its path is empty. Null
  // without a scheme, and for a file's.
  static NSURLPtr URLWithString(std::string string);
  explicit NSURL(std::string path);
  NSURL(const NSURL& other)
      : _path(other._path), _address(other._address), _physical(other.isPhysical()) {}
  NSURL& operator=(const NSURL&) = delete;

  const std::string& path() const { return _path; }
  // What follows the last separator; "/" for the root.
  std::string lastPathComponent() const;
  NSURLPtr URLByAppendingPathComponent(const std::string& component) const;
  // Never null: the root answers itself.
  NSURLPtr URLByDeletingLastPathComponent() const;
  NSURLPtr copy() const { return std::make_shared<NSURL>(*this); }

  bool isFileURL() const { return _address.empty(); }

  // "file://" and the path, with every byte escaped that is not plain in a URL; another
  // address as it was given.
  std::string absoluteString() const;

  // Marks the URL as naming the physical file rather than its logical placeholder.
  void attachPhysicalProperty() { _physical.store(true, std::memory_order_relaxed); }
  bool isPhysical() const { return _physical.load(std::memory_order_relaxed); }

  // By location alone, as the attached property is no part of the name.
  friend bool operator==(const NSURL& a, const NSURL& b) {
    return a._path == b._path && a._address == b._address;
  }

 private:
  NSURL(std::string path, std::string address)
      : _path(std::move(path)), _address(std::move(address)) {}

  const std::string _path;
  const std::string _address;  // of what is no file; else empty
  std::atomic<bool> _physical{false};
};

// Two references name the same location; nil equals nil alone.
bool isEqualURL(const NSURLPtr& a, const NSURLPtr& b);

}  // namespace skein
