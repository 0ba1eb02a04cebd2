# The Debian packages that cpack makes of the components.

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME tavrind)
set(CPACK_PACKAGE_CONTACT "The maintainers of tavrind <tavrind@quorvane.example>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_COMPONENTS_ALL ${PACKAGES})
set(CPACK_STRIP_FILES ON)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE
                                                WORLD_READ WORLD_EXECUTE)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_COMPRESSION_TYPE xz)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)

# package(<name> <section> <description: a line and a text> [<field> <value>]…)
function(package name section description)
  string(TOUPPER ${name} upper)
  set(CPACK_DEBIAN_${upper}_PACKAGE_NAME ${name} PARENT_SCOPE)
  set(CPACK_DEBIAN_${upper}_PACKAGE_SECTION ${section} PARENT_SCOPE)
  set(CPACK_COMPONENT_${upper}_DESCRIPTION "${description}" PARENT_SCOPE)
  while(ARGN)
    list(POP_FRONT ARGN field value)
    set(CPACK_DEBIAN_${upper}_${field} "${value}" PARENT_SCOPE)
  endwhile()
endfunction()

package(tavrind utils "background daemon for search on a device
Connects the device's search clients with a remote search service: builds
the requests, answers repeated typing from memory, loads images ahead, and
uploads feedback later. Starts when a client connects.

This package has the daemon with its systemd user units, and tavrinctl, a
client for people and scripts."
  PACKAGE_SHLIBDEPS ON
  PACKAGE_RECOMMENDS "ca-certificates, dbus-user-session"
  PACKAGE_SUGGESTS "tavrin-clients, geoclue-2.0, network-manager")

package(libcoretavrin-dev libdevel "C++ client library of the search daemon tavrind
Headers and a static library for programs that search with the daemon, and
files for CMake and pkg-config."
  PACKAGE_DEPENDS "libsystemd-dev, libsimdjson-dev, libplist-dev, libicu-dev, libssl-dev, libcurl4-openssl-dev | libcurl4-gnutls-dev, libsqlite3-dev, libfmt-dev, libspdlog-dev"
  PACKAGE_SUGGESTS "tavrind")

package(tavrin-clients utils "search clients of the daemon tavrind
The Python package tavrin, an extension with its native messaging host for
the address field of Chromium and Firefox, and a search provider for the
desktop's search screens."
  PACKAGE_ARCHITECTURE all
  PACKAGE_DEPENDS "tavrind (>= ${PROJECT_VERSION}), python3 (>= 3.11), python3-jeepney, python3-pil"
  PACKAGE_RECOMMENDS "dbus-user-session, xdg-utils"
  PACKAGE_SUGGESTS "chromium | firefox-esr, gnome-shell | plasma-workspace")
set(CPACK_DEBIAN_TAVRIN-CLIENTS_PACKAGE_CONTROL_EXTRA
    ${CMAKE_CURRENT_SOURCE_DIR}/clients/conffiles ${CMAKE_CURRENT_SOURCE_DIR}/clients/postinst
    ${CMAKE_CURRENT_SOURCE_DIR}/clients/prerm)

package(tavrin-devtools devel "development service and replayer for the search daemon tavrind
tavrin-devserver is a search service for development: it serves a catalogue
over HTTPS, fails on demand and shows what was uploaded, also on a console
page. tavrin-replay types a corpus of queries into a running daemon and
reports how it answered."
  PACKAGE_SHLIBDEPS ON
  PACKAGE_SUGGESTS "tavrind, libjs-chart.js")

include(CPack)
