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
skein_find(CLI11 libcli11-dev)
skein_find(nlohmann_json nlohmann-json3-dev)
pkg_check_modules(GIO IMPORTED_TARGET gio-2.0 gio-unix-2.0)
if(NOT GIO_FOUND)
  message(FATAL_ERROR "gio-2.0 is missing: install libglib2.0-dev, or run ./setup")
endif()
