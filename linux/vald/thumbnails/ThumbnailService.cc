#include "linux/vald/thumbnails/ThumbnailService.h"

#include <utility>

namespace skein::vald {
namespace {

// Threads beside those that wait for a drawing: one that reads and writes, one for the
// desktop's cache.
constexpr std::size_t kOtherThreads = 2;

}  // namespace

Outcome<std::unique_ptr<ThumbnailService>> ThumbnailService::start(Parts parts) {
  auto assets = ThumbnailAssets::open(parts.folder, parts.files);
  if (!assets) return assets.error();
  std::unique_ptr<ThumbnailService> service(
      new ThumbnailService(std::move(parts), std::move(*assets)));
  service->_maker->makeMissing();
  return service;
}

ThumbnailService::ThumbnailService(Parts parts, std::unique_ptr<ThumbnailAssets> assets)
    : _records(parts.records),
      _assets(std::move(assets)),
      _pool(std::make_shared<ThreadPool>(parts.renderer.limit + kOtherThreads, "thumbnails")) {
  const std::size_t limit = parts.renderer.limit;
  _renderer =
      std::make_unique<ThumbnailRenderer>(std::move(parts.renderer), _pool, parts.clock, parts.log);
  // The renderer always has the next document at hand.
  _maker = std::make_unique<ThumbnailMaker>(
      ThumbnailServices{parts.contents, parts.records, *_assets, *_renderer, parts.log,
                        std::move(parts.contentType)},
      _pool, 2 * limit);
  _desktop = std::make_unique<DesktopThumbnails>(std::move(parts.desktopFolder), *_renderer, _pool,
                                                 parts.log);
}

ThumbnailService::~ThumbnailService() {
  // From the outside in: nothing is asked of the renderer any more when it goes.
  _maker.reset();
  _desktop.reset();
  _renderer.reset();
}

Outcome<std::uint64_t> ThumbnailService::collectGarbage() {
  return _assets->collectGarbage([this](const ContentHash& contents) {
    const auto references = _records.references(contents);
    return !references || *references > 0;
  });
}

}  // namespace skein::vald
