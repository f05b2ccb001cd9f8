# Everything comes from Debian; a missing package is named.
find_package(Threads REQUIRED)
find_package(PkgConfig REQUIRED)

macro(skein_find package debian)
  find_package(${package} QUIET)
  if(NOT ${package}_FOUND)
    message(FATAL_ERROR "${package} is missing: install ${debian}, or run ./setup")
  endif()
endmacro()

skein_find(CapnProto "capnproto libcapnp-dev")
skein_find(SQLite3 libsqlite3-dev)
skein_find(OpenSSL libssl-dev)
skein_find(CLI11 libcli11-dev)
skein_find(nlohmann_json nlohmann-json3-dev)

# pkg_check_modules(), with a message that names the package.
macro(skein_find_module name debian)
  pkg_check_modules(${name} IMPORTED_TARGET ${ARGN})
  if(NOT ${name}_FOUND)
    message(FATAL_ERROR "${ARGN} is missing: install ${debian}, or run ./setup")
  endif()
endmacro()

skein_find_module(GIO libglib2.0-dev gio-2.0 gio-unix-2.0)
skein_find_module(GDK_PIXBUF libgdk-pixbuf-2.0-dev gdk-pixbuf-2.0)
skein_find_module(PANGO libpango1.0-dev pangocairo pangofc)
skein_find_module(SECCOMP libseccomp-dev libseccomp)
skein_find_module(POPPLER libpoppler-glib-dev poppler-glib)
