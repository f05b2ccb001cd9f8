#include "linux/vald/thumbnails/RenderErrors.h"

#include <utility>

namespace skein::vald {

NSErrorPtr renderError(RenderFailure failure, std::string words) {
  return NSError::errorWithDomain(SkeinRenderErrorDomain, static_cast<std::int64_t>(failure),
                                  {{NSLocalizedDescriptionKey, std::move(words)}});
}

NSErrorPtr renderErrorOf(RenderStatus status, PictureKind kind) {
  const std::string name(pictureKindName(kind));
  switch (status) {
    case RenderStatus::Malformed:
      return renderError(RenderFailure::Malformed,
                         "The document can't be read as " + name + "; open it in its program.");
    case RenderStatus::Empty:
      return renderError(RenderFailure::Empty, "The document has nothing to show.");
    case RenderStatus::TooLarge:
      return renderError(RenderFailure::TooLarge, "The document is too large to be drawn here.");
    case RenderStatus::Unsupported:
      return renderError(RenderFailure::Unsupported,
                         "No loader for " + name +
                             " is installed; install webp-pixbuf-loader or librsvg2-common.");
    case RenderStatus::Drawn:
    case RenderStatus::Failed: break;
  }
  return renderError(RenderFailure::CouldNotBeWritten,
                     "The document could not be read, or its picture not be written; try again.");
}

bool isAboutDocument(const NSErrorPtr& error) {
  return error != nullptr && error->domain() == SkeinRenderErrorDomain &&
         error->code() < static_cast<std::int64_t>(RenderFailure::Unsupported);
}

}  // namespace skein::vald
