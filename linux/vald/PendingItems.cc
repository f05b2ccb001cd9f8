#include "linux/vald/PendingItems.h"

#include <utility>

#include "linux/protocol/AnswerRoom.h"

namespace skein::vald {

void PendingItems::add(VLQueryItemPtr item) {
  const auto [found, isNew] = _placeByID.try_emplace(item->fileObjectID(), _items.size());
  if (isNew) {
    _items.push_back(std::move(item));
  } else {
    _items[found->second] = std::move(item);
  }
}

VLQueryItems PendingItems::take(std::size_t limit) {
  VLQueryItems batch;
  AnswerRoom room;
  while (batch.size() < limit && _taken < _items.size() && room.take(bytesOf(_items[_taken]))) {
    VLQueryItemPtr item = std::move(_items[_taken++]);
    _placeByID.erase(item->fileObjectID());
    batch.push_back(std::move(item));
  }
  if (_taken == _items.size()) {
    clear();
  } else if (_taken > _items.size() / 2) {
    // The places of what is left move with it; paid for by what was taken.
    _items.erase(_items.begin(), _items.begin() + static_cast<std::ptrdiff_t>(_taken));
    _taken = 0;
    for (std::size_t i = 0; i < _items.size(); ++i) _placeByID[_items[i]->fileObjectID()] = i;
  }
  return batch;
}

void PendingItems::clear() {
  _items.clear();
  _taken = 0;
  _placeByID.clear();
}

}  // namespace skein::vald
