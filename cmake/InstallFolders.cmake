# Where things get installed. The daemon's fixed paths lie below /usr: another prefix is for trying things out, with --root.

if(CMAKE_INSTALL_PREFIX_INITIALIZED_TO_DEFAULT)
  set(CMAKE_INSTALL_PREFIX /usr CACHE PATH "Where things get installed" FORCE)
endif()
include(GNUInstallDirs)
