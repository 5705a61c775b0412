# Installing korvo_soundmeter: the plug-in and the platform stand-in, the headers a host
# compiles against, the soundmeter command with its manual page, the README, a pkg-config
# file and a CMake package (find_package(korvo_soundmeter)).
include(CMakePackageConfigHelpers)

# The layout is fixed, not taken from GNUInstallDirs: the command loads
# ../lib/libkorvo_soundmeter.so next to itself (RUNPATH $ORIGIN/../lib) and the plug-in
# finds the stand-in beside it (RUNPATH $ORIGIN), so bin and lib must stay siblings.
set(KORVO_INSTALL_BINDIR bin)
set(KORVO_INSTALL_LIBDIR lib)
set(KORVO_INSTALL_INCLUDEDIR include/korvo_soundmeter)
set(KORVO_INSTALL_CMAKEDIR ${KORVO_INSTALL_LIBDIR}/cmake/korvo_soundmeter)
set(KORVO_INSTALL_DOCDIR share/doc/korvo_soundmeter)
set(KORVO_INSTALL_MANDIR share/man/man1)
set(KORVO_PACKAGE_DIR ${CMAKE_BINARY_DIR}/package)

# Both libraries are built with their install RUNPATH already, so they are copied as built.
install(TARGETS korvo_soundmeter korvo_platform LIBRARY DESTINATION ${KORVO_INSTALL_LIBDIR})

# A host writes #include <SoundMeter_vir.h>; the header's own "Export.h" and
# <system/audio.h> resolve inside the same folder.
# SoundMeterConstants.h: the numbers the library shares with its hosts (code plan, sizes);
# FrameRecord.h: the frame record a host reads with read_write_audio.
install(FILES ${CMAKE_SOURCE_DIR}/interface/SoundMeter_vir.h ${CMAKE_SOURCE_DIR}/interface/Export.h
  ${CMAKE_SOURCE_DIR}/interface/SoundMeterConstants.h
  ${CMAKE_SOURCE_DIR}/interface/FrameRecord.h
  DESTINATION ${KORVO_INSTALL_INCLUDEDIR})
install(FILES ${CMAKE_SOURCE_DIR}/platform/include/system/audio.h
  DESTINATION ${KORVO_INSTALL_INCLUDEDIR}/system)

install(FILES ${CMAKE_SOURCE_DIR}/README.md DESTINATION ${KORVO_INSTALL_DOCDIR})

# pkg-config: the prefix comes from the .pc file's own place, so it needs no
# configuring for the install prefix, which is only known at install time.
configure_file(${CMAKE_CURRENT_LIST_DIR}/korvo_soundmeter.pc.in ${KORVO_PACKAGE_DIR}/korvo_soundmeter.pc @ONLY)
install(FILES ${KORVO_PACKAGE_DIR}/korvo_soundmeter.pc DESTINATION ${KORVO_INSTALL_LIBDIR}/pkgconfig)

# The CMake package: written by hand rather than install(EXPORT), which would drag the
# object and internal libraries the plug-in is built from into the package.
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/korvo_soundmeterConfig.cmake.in
  ${KORVO_PACKAGE_DIR}/korvo_soundmeterConfig.cmake
  INSTALL_DESTINATION ${KORVO_INSTALL_CMAKEDIR}
  PATH_VARS KORVO_INSTALL_LIBDIR KORVO_INSTALL_INCLUDEDIR)
write_basic_package_version_file(${KORVO_PACKAGE_DIR}/korvo_soundmeterConfigVersion.cmake
  VERSION ${PROJECT_VERSION} COMPATIBILITY SameMajorVersion)
install(FILES ${KORVO_PACKAGE_DIR}/korvo_soundmeterConfig.cmake ${KORVO_PACKAGE_DIR}/korvo_soundmeterConfigVersion.cmake
  DESTINATION ${KORVO_INSTALL_CMAKEDIR})

if(NOT TARGET soundmeter)
  return()
endif()
install(TARGETS soundmeter RUNTIME DESTINATION ${KORVO_INSTALL_BINDIR})

# The manual page, made from the help texts by every build so that it never lags behind
# the command: help2man turns the top-level --help into the page, and the script adds a
# section per subcommand from its own --help.
find_program(KORVO_HELP2MAN help2man)
if(NOT KORVO_HELP2MAN)
  message(FATAL_ERROR "help2man not found: it makes the manual page (scripts/install-deps.sh installs it)")
endif()
set(KORVO_MAN_PAGE ${KORVO_PACKAGE_DIR}/soundmeter.1)
set(KORVO_MAN_COMMANDS ${KORVO_PACKAGE_DIR}/soundmeter-commands.h2m)
add_custom_command(OUTPUT ${KORVO_MAN_PAGE}
  COMMAND ${CMAKE_SOURCE_DIR}/scripts/man-commands.sh $<TARGET_FILE:soundmeter> ${KORVO_MAN_COMMANDS}
  COMMAND ${KORVO_HELP2MAN} --no-info --section=1
    "--name=exchange small numeric tone codes by sound"
    --source=korvo_soundmeter --include=${KORVO_MAN_COMMANDS}
    --output=${KORVO_MAN_PAGE} $<TARGET_FILE:soundmeter>
  DEPENDS soundmeter ${CMAKE_SOURCE_DIR}/scripts/man-commands.sh
  COMMENT "Making the manual page soundmeter.1"
  VERBATIM)
add_custom_target(soundmeter_man ALL DEPENDS ${KORVO_MAN_PAGE})
install(FILES ${KORVO_MAN_PAGE} DESTINATION ${KORVO_INSTALL_MANDIR})
