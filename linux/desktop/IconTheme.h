#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace skein {

// The desktop's icon theme, with what it inherits and "hicolor" at the end, as the icon theme
// rules have it. Knows the folders that there were when it was loaded; looks for icons in
// them anew each time. Immutable; any thread.
class IconTheme {
 public:
  // The theme called `name` below `baseFolders`, in order of precedence. Where no "hicolor"
  // has an index, its usual folders are looked at.
  static std::shared_ptr<const IconTheme> load(const std::string& name,
                                               std::vector<std::string> baseFolders);
  // The user's: as the desktop's settings say, below ~/.icons, $XDG_DATA_HOME/icons,
  // $XDG_DATA_DIRS/icons and /usr/share/pixmaps.
  static std::shared_ptr<const IconTheme> installed();

  // The PNG or SVG file of an icon that is shown `side` pixels wide: one of a folder for that
  // size, else of the folder nearest to it; the first theme that has any decides. `icon`: a
  // name, or a file's absolute path. Nil when there is none.
  std::optional<std::string> pathOfIcon(const std::string& icon, int side) const;

 private:
  // A folder of icons, and the sizes that they are for.
  struct Folder {
    std::string path;
    int least = 0;
    int most = 0;

    int distanceTo(int side) const {
      return side < least ? least - side : side > most ? side - most : 0;
    }
  };
  using Theme = std::vector<Folder>;

  IconTheme() = default;
  // Adds the theme and what it inherits, once each.
  void add(const std::string& name, std::vector<std::string>& seen);

  std::vector<std::string> _baseFolders;
  std::vector<Theme> _themes;
};

}  // namespace skein
