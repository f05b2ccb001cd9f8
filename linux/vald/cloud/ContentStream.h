// Contents on their way: read in pieces, hashed and, when there is somewhere to, written.
#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "linux/vald/cloud/ContentHash.h"
#include "linux/vald/cloud/Outcome.h"
#include "linux/vald/files/FileLayer.h"

namespace skein::vald {

struct HashedContents {
  ContentHash hash;
  std::uint64_t size = 0;
};

// Called before the first piece, with 0, and after each: how many bytes have passed. May
// wait (bandwidth), and stops the stream with the error it answers. The piece itself may be
// changed before it is hashed and written: a cloud that corrupts contents does.
class StreamObserver {
 public:
  virtual ~StreamObserver() = default;
  virtual NSErrorPtr didPass(std::uint64_t bytes) = 0;
  virtual void willPass(char* /*data*/, std::size_t /*size*/) {}
  // How much may pass at once.
  virtual std::size_t pieceSize() const { return kLargestPiece; }

  static constexpr std::size_t kLargestPiece = std::size_t{256} << 10;
};

// Reading here, without the cloud's conditions.
class LocalRead final : public StreamObserver {
 public:
  NSErrorPtr didPass(std::uint64_t) override { return nullptr; }
};

// Reads `file` from its start to its end. `name` is for errors. Any thread; blocks.
Outcome<HashedContents> hashContents(int file, const std::string& name, StreamObserver& observer);

// The same, and writes what passes to `target`, which is empty.
Outcome<HashedContents> copyContents(FileLayer& files, int file, int target,
                                     const std::string& name, StreamObserver& observer);

// Asks for the space at once, so that a full disk shows before the work is done, and the
// file lies in one piece. 0, also where the file system cannot; or the errno.
int reserveSpace(FileLayer& files, int file, std::uint64_t size);

}  // namespace skein::vald
