#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace skein::vald {

// A POSIX access list as the system gives it, in the attribute "system.posix_acl_access". One
// that is empty, or that this does not understand, has no entries.
class AccessList {
 public:
  explicit AccessList(std::string bytes);

  bool isEmpty() const { return _bytes.empty(); }
  const std::string& bytes() const { return _bytes; }
  // What the owning group may do, rwx as 0 to 7: never more than the list's mask.
  unsigned groupPermissions() const;
  // The owning group may do no more than `most`.
  void limitGroup(unsigned most);

 private:
  enum class Tag : std::uint16_t { Group = 4, Mask = 16 };
  // Where the entry is; `npos` when there is none.
  std::size_t find(Tag tag) const;
  unsigned permissions(std::size_t entry) const;

  std::string _bytes;
};

}  // namespace skein::vald
