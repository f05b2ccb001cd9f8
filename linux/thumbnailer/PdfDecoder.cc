#include <poppler.h>
#include <sys/mman.h>
#include <unistd.h>

#include "linux/thumbnailer/Decoders.h"
#include "linux/thumbnailer/Surfaces.h"

namespace skein::thumbnailer {
namespace {

// All of a document in the address space. A file that shrinks meanwhile ends the worker,
// which costs that document alone.
class MappedDocument {
 public:
  explicit MappedDocument(int document) : _length(lseek(document, 0, SEEK_END)) {
    if (_length <= 0 || static_cast<std::uint64_t>(_length) > kMostDocumentBytes) return;
    void* data = mmap(nullptr, size(), PROT_READ, MAP_PRIVATE, document, 0);
    if (data != MAP_FAILED) _data = data;
  }
  ~MappedDocument() {
    if (_data != nullptr) munmap(_data, size());
  }
  MappedDocument(const MappedDocument&) = delete;
  MappedDocument& operator=(const MappedDocument&) = delete;

  off_t length() const { return _length; }
  std::size_t size() const { return static_cast<std::size_t>(_length); }
  const void* data() const { return _data; }

 private:
  const off_t _length;
  void* _data = nullptr;
};

struct BytesUnref {
  void operator()(GBytes* bytes) const { g_bytes_unref(bytes); }
};

}  // namespace

Decoded decodePdf(int document, std::uint32_t side) {
  const MappedDocument mapped(document);
  if (mapped.length() == 0) return {RenderStatus::Empty};
  if (mapped.length() > 0 && static_cast<std::uint64_t>(mapped.length()) > kMostDocumentBytes) {
    return {RenderStatus::TooLarge};
  }
  if (mapped.data() == nullptr) return {RenderStatus::Failed};
  const std::unique_ptr<GBytes, BytesUnref> bytes(g_bytes_new_static(mapped.data(), mapped.size()));
  const ObjectPtr<PopplerDocument> pages(
      poppler_document_new_from_bytes(bytes.get(), nullptr, nullptr));
  if (!pages) return {RenderStatus::Malformed};
  if (poppler_document_get_n_pages(pages.get()) < 1) return {RenderStatus::Empty};
  const ObjectPtr<PopplerPage> page(poppler_document_get_page(pages.get(), 0));
  if (!page) return {RenderStatus::Malformed};

  double width = 0;
  double height = 0;
  poppler_page_get_size(page.get(), &width, &height);
  // Also false for what is no number.
  if (!(width > 0 && height > 0 && width < 1e6 && height < 1e6)) return {RenderStatus::Malformed};
  const FittedSize size = fittedSize(width, height, side);
  const Paper paper(size);
  cairo_scale(paper.context.get(), size.width / width, size.height / height);
  poppler_page_render(page.get(), paper.context.get());
  return pixelsOf(paper);
}

}  // namespace skein::thumbnailer
