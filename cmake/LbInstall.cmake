# The installed tree, by component (each becomes one Debian package, see LbPackaging.cmake):
#
#   runtime    <libdir>/libvisa.so.2, <libdir>/libNiViSv64.so.2 (with their full-version files)
#   passport   <libdir>/lbvisa/LbViPmx64.so, <prefix>/etc/lbvisa/passports.d/LbViPmx64.conf
#              (/etc for the prefix /usr) naming it, and the example program <bindir>/lbpmx-measure
#   sensorsim  <libdir>/libPmxControl2_64.so.2, the simulated sensor-control library
#   dev        <includedir>/lbvisa/ (visa.h and the headers it includes, pmxsim/PmxControl2.h, pmxsim/PmxSim.h),
#              the .so links, <libdir>/pkgconfig/{visa,pmxcontrol2}.pc (not on Windows), the
#              CMake package <libdir>/cmake/LbPmxVisa (imported targets LbPmxVisa::visa,
#              ::NiViSv64, ::PmxControl2_64) and the example's source
#
# Windows: every DLL and the example in bin/, where the runtime finds the passport by its file
# name, import libraries in lib/, and LbViPmx64.reg / LbViPmx64-unregister.reg at the top.
set(LB_PACKAGE_VERSION ${PROJECT_VERSION})
set(LB_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/LbPmxVisa)
set(LB_PASSPORT_DIR ${CMAKE_INSTALL_LIBDIR}/lbvisa)
if(WIN32)
  set(LB_PASSPORT_DIR ${CMAKE_INSTALL_BINDIR})
endif()

# The loader finds libraries of the prefixes /usr and / by itself (and Debian packages must not
# carry a search path); other prefixes get one relative to each installed file.
if(NOT WIN32 AND NOT CMAKE_INSTALL_PREFIX MATCHES "^/(usr/?)?$")
  file(RELATIVE_PATH _lb_bin_to_lib ${CMAKE_INSTALL_FULL_BINDIR} ${CMAKE_INSTALL_FULL_LIBDIR})
  set_target_properties(visa NiViSv64 PmxControl2_64 PROPERTIES INSTALL_RPATH "$ORIGIN")
  set_target_properties(LbViPmx64 PROPERTIES INSTALL_RPATH "$ORIGIN/..")
  foreach(_lb_program lbpmx-measure lbpmx-lan)
    if(TARGET ${_lb_program})
      set_target_properties(${_lb_program} PROPERTIES INSTALL_RPATH "$ORIGIN/${_lb_bin_to_lib}")
    endif()
  endforeach()
endif()

install(TARGETS visa NiViSv64 EXPORT LbPmxVisaTargets
  RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT runtime
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT runtime NAMELINK_COMPONENT dev
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT dev
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/lbvisa)
install(TARGETS PmxControl2_64 EXPORT LbPmxVisaTargets
  RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT sensorsim
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT sensorsim NAMELINK_COMPONENT dev
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT dev
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/lbvisa)
install(TARGETS LbViPmx64 LIBRARY DESTINATION ${LB_PASSPORT_DIR} COMPONENT passport)
foreach(_lb_program lbpmx-measure lbpmx-lan)
  if(TARGET ${_lb_program})
    install(TARGETS ${_lb_program} RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT passport)
  endif()
endforeach()

# Headers, kept in their own folder beside other VISA implementations' headers.
install(DIRECTORY visahost/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/lbvisa COMPONENT dev
  FILES_MATCHING PATTERN "*.h")
install(FILES pmxsim/PmxControl2.h pmxsim/PmxSim.h
  DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/lbvisa/pmxsim COMPONENT dev)

# pkg-config (not on Windows): `pkg-config --cflags --libs visa`.
if(NOT WIN32)
  set(LB_PC_PREFIX ${CMAKE_INSTALL_PREFIX})
  set(LB_PC_LIBDIR ${CMAKE_INSTALL_FULL_LIBDIR})
  set(LB_PC_INCLUDEDIR ${CMAKE_INSTALL_FULL_INCLUDEDIR})
  foreach(_lb_pc visa pmxcontrol2)
    configure_file(packaging/${_lb_pc}.pc.in ${CMAKE_BINARY_DIR}/pkgconfig/${_lb_pc}.pc @ONLY)
    install(FILES ${CMAKE_BINARY_DIR}/pkgconfig/${_lb_pc}.pc
      DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT dev)
  endforeach()
endif()

# CMake: find_package(LbPmxVisa) and link LbPmxVisa::visa.
include(CMakePackageConfigHelpers)
install(EXPORT LbPmxVisaTargets NAMESPACE LbPmxVisa:: DESTINATION ${LB_CMAKE_DIR} COMPONENT dev)
configure_package_config_file(cmake/LbPmxVisaConfig.cmake.in
  ${CMAKE_BINARY_DIR}/cmake/LbPmxVisaConfig.cmake INSTALL_DESTINATION ${LB_CMAKE_DIR})
write_basic_package_version_file(${CMAKE_BINARY_DIR}/cmake/LbPmxVisaConfigVersion.cmake
  VERSION ${PROJECT_VERSION} COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_BINARY_DIR}/cmake/LbPmxVisaConfig.cmake
  ${CMAKE_BINARY_DIR}/cmake/LbPmxVisaConfigVersion.cmake DESTINATION ${LB_CMAKE_DIR} COMPONENT dev)

if(WIN32)
  install(FILES examples/measure.c DESTINATION examples COMPONENT dev)
  # Registry files for regedit / reg import, with Windows line ends.
  foreach(_lb_reg LbViPmx64 LbViPmx64-unregister)
    configure_file(packaging/windows/${_lb_reg}.reg.in ${CMAKE_BINARY_DIR}/packaging/${_lb_reg}.reg
      @ONLY NEWLINE_STYLE CRLF)
    install(FILES ${CMAKE_BINARY_DIR}/packaging/${_lb_reg}.reg DESTINATION . COMPONENT passport)
  endforeach()
else()
  install(FILES examples/measure.c
    DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/lbvisa-dev/examples COMPONENT dev)
  # The system's passport configuration (see visahost/PassportConfig.h): the prefixes /usr and
  # / keep it in /etc. The entry is relative to the runtime's library folder.
  if(CMAKE_INSTALL_PREFIX MATCHES "^/(usr/?)?$")
    set(LB_PASSPORT_CONF_DIR /etc/lbvisa/passports.d)
  else()
    set(LB_PASSPORT_CONF_DIR etc/lbvisa/passports.d)
  endif()
  file(RELATIVE_PATH LB_PASSPORT_ENTRY ${CMAKE_INSTALL_FULL_LIBDIR}
    ${CMAKE_INSTALL_PREFIX}/${LB_PASSPORT_DIR}/LbViPmx64${CMAKE_SHARED_MODULE_SUFFIX})
  configure_file(packaging/LbViPmx64.conf.in ${CMAKE_BINARY_DIR}/packaging/LbViPmx64.conf @ONLY)
  install(FILES ${CMAKE_BINARY_DIR}/packaging/LbViPmx64.conf
    DESTINATION ${LB_PASSPORT_CONF_DIR} COMPONENT passport)
endif()
