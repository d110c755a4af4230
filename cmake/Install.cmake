# What `cmake --install` puts where, but for the client library, which its own folder installs.
#
# Components: `daemon` and `tools`; `library` and `development` are the client library's.

set(packaging ${PROJECT_SOURCE_DIR}/packaging)

# tallyd_install_compressed(FILE NAME DESTINATION COMPONENT): installs FILE as NAME.gz, the same bytes from every build.
find_program(GZIP_PROGRAM gzip REQUIRED)
function(tallyd_install_compressed file name destination component)
  set(compressed ${PROJECT_BINARY_DIR}/compressed/${component}/${name}.gz)
  add_custom_command(OUTPUT ${compressed}
    COMMAND ${CMAKE_COMMAND} -E make_directory ${PROJECT_BINARY_DIR}/compressed/${component}
    COMMAND ${GZIP_PROGRAM} -9cn ${file} > ${compressed}
    DEPENDS ${file} VERBATIM)
  add_custom_target(compressed-${component}-${name} ALL DEPENDS ${compressed})
  install(FILES ${compressed} DESTINATION ${destination} COMPONENT ${component})
endfunction()

# tallyd_install_pages(COMPONENT FILE...): those manual pages, each in the folder of its section.
function(tallyd_install_pages component)
  foreach(page ${ARGN})
    get_filename_component(name ${page} NAME)
    string(REGEX MATCH "[0-9]$" section ${name})
    tallyd_install_compressed(${page} ${name} ${CMAKE_INSTALL_MANDIR}/man${section} ${component})
  endforeach()
endfunction()

# tallyd_install_notices(COMPONENT PACKAGE): what every package says about itself.
function(tallyd_install_notices component package)
  set(folder ${CMAKE_INSTALL_DATADIR}/doc/${package})
  install(FILES ${packaging}/debian/copyright DESTINATION ${folder} COMPONENT ${component})
  tallyd_install_compressed(${packaging}/debian/changelog changelog ${folder} ${component})
endfunction()

# The daemon.

install(TARGETS tallyd RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR} COMPONENT daemon)
file(GLOB daemonPages CONFIGURE_DEPENDS ${packaging}/man/*.5 ${packaging}/man/*.7 ${packaging}/man/*.8)
tallyd_install_pages(daemon ${daemonPages})
install(FILES ${packaging}/sandbox/com.quillon.tallyd.plist DESTINATION ${CMAKE_INSTALL_DATADIR}/tally/sandbox
  COMPONENT daemon)
install(DIRECTORY ${packaging}/Tally.framework DESTINATION ${CMAKE_INSTALL_DATADIR}/tally COMPONENT daemon)
set(TALLYD_PUBLIC_KEY "" CACHE FILEPATH "The storebags' key (DER) that gets installed; without it the operator brings one")
if(TALLYD_PUBLIC_KEY)
  install(FILES ${TALLYD_PUBLIC_KEY} DESTINATION ${CMAKE_INSTALL_DATADIR}/tally/Tally.framework/Resources
    RENAME publicKey.der COMPONENT daemon)
endif()
install(FILES ${packaging}/systemd/tallyd.service ${packaging}/systemd/tallyd.socket DESTINATION lib/systemd/system
  COMPONENT daemon)
install(FILES ${packaging}/systemd/tallyd.sysusers DESTINATION lib/sysusers.d RENAME tallyd.conf COMPONENT daemon)
install(FILES ${packaging}/systemd/tallyd.tmpfiles DESTINATION lib/tmpfiles.d RENAME tallyd.conf COMPONENT daemon)
# What is written for operators; the architecture page is for the project's developers.
file(GLOB pages CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/docs/*.md)
list(FILTER pages EXCLUDE REGEX "/architecture\\.md$")
install(FILES ${pages} DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/tallyd COMPONENT daemon)

# The tools; the station is there only where its HTTP library is.

file(GLOB toolPages CONFIGURE_DEPENDS ${packaging}/man/*.1)
foreach(tool tallyctl tally-station tally-storebag)
  if(TARGET ${tool})
    install(TARGETS ${tool} RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT tools)
    set(page ${packaging}/man/${tool}.1)
    if(page IN_LIST toolPages)
      tallyd_install_pages(tools ${page})
    endif()
  endif()
endforeach()

# Shell completions: NAME for bash, _NAME for zsh, NAME.fish.

file(GLOB completions CONFIGURE_DEPENDS ${packaging}/completions/*)
foreach(completion ${completions})
  get_filename_component(name ${completion} NAME)
  if(name MATCHES "^_")
    set(folder zsh/vendor-completions)
  elseif(name MATCHES "\\.fish$")
    set(folder fish/vendor_completions.d)
  else()
    set(folder bash-completion/completions)
  endif()
  install(FILES ${completion} DESTINATION ${CMAKE_INSTALL_DATADIR}/${folder} COMPONENT tools)
endforeach()
