// What a crash, or a step that failed, left of an eviction or a download.
#pragma once

#include <optional>

#include "linux/vald/cloud/CloudPlaces.h"

namespace skein::vald {

// Brings one document's place into order: contents on their way in and markers being
// written are removed; a file set aside is put back and its marker removed; a file and a
// marker that stand for the same contents become the file alone. A file that is none of
// this system's doing is never touched: a marker beside a file with other contents stays,
// and a file set aside whose name was taken meanwhile gets another name. What stands for what
// is told by contents. `noted`: what the place's note says of the contents; a file set aside
// that is just that, whose marker was moved away since, is what the eviction was about to
// remove, and goes when the cloud's copy is whole. Nothing may be under way there, and its
// lock is held. Durable when it answers null: then the note may end.
NSErrorPtr recoverPlace(const CloudPlaces& places, const StorePlace& place,
                        const std::optional<ContentHash>& noted = std::nullopt);

// The same, with what the notes say, if there are notes of the place; they end. A file set aside
// that no note tells of, since the notes were lost, becomes the document where its marker stands
// for the same contents; else it gets another name, and the marker stays.
NSErrorPtr recoverNoted(const CloudPlaces& places, const StorePlace& place);

// Removes the marker beside a file that is a newer revision of the same document, and
// uploaded: another program wrote it while the document was evicted. Any other marker stays.
// The place's lock is held.
NSErrorPtr removeStaleMarker(const CloudPlaces& places, const StorePlace& place,
                             VLFileObjectID document);

// A document's file that is about to leave its place would leave the marker of an older version
// behind, which would then stand for the document. It gets another name ("letter 2.txt" of
// letter.txt) and is a document of its own: whether the file is a newer version, or another
// document that was moved to the name of an evicted one, nobody can tell. Nothing happens where
// there is no such marker. Takes the place's lock.
NSErrorPtr nameOlderVersionApart(const CloudPlaces& places, const std::string& path,
                                 VLFileObjectID document);

// recoverPlace() for everything that was under way when the process ended. At start, before the
// first eviction or download. Goes on after a place that cannot be mended, which stays noted
// for the next start, and answers the first error. A folder that was moved is looked for; one
// that is gone is in order.
NSErrorPtr recoverUnfinishedWork(const CloudPlaces& places);

}  // namespace skein::vald
