# CPack: one Debian package per install component (cpack -G DEB in a Linux build configured
# with the prefix /usr; scripts/package.sh does both), or one ZIP of everything on Windows.
#
#   lbvisa-runtime   runtime     the VISA runtime: libvisa.so.2 and libNiViSv64.so.2
#   lbpmx-passport   passport    the passport, its configuration file and the example program;
#                                depends on the runtime and on any sensor-control library
#   pmxcontrol2-sim  sensorsim   the simulated sensor-control library; provides (and conflicts
#                                with) pmxcontrol2, so a real vendor library package replaces it
#   python3-pmxsim   python      the Python module pmxsim that scripts the simulated sensors
#   lbvisa-dev       dev         headers, .so links, pkg-config and CMake files, example source
set(LB_MAINTAINER "Marlowe and Tenby Packaging <packaging@marlowe-tenby.example>")
set(LB_COPYRIGHT_HOLDER "Marlowe&Tenby")

set(CPACK_PACKAGE_NAME LbPmxVisa)
set(CPACK_PACKAGE_VENDOR "${LB_COPYRIGHT_HOLDER}")
set(CPACK_PACKAGE_CONTACT "${LB_MAINTAINER}")
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_COMPONENTS_ALL runtime passport sensorsim python dev)
set(CPACK_STRIP_FILES ON)

if(WIN32)
  set(CPACK_GENERATOR ZIP)
  set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "VISA passport for USB power sensors")
  set(CPACK_PACKAGE_FILE_NAME LbPmxVisa-${PROJECT_VERSION}-win64)
  set(CPACK_ARCHIVE_COMPONENT_INSTALL OFF)
  set(CPACK_INCLUDE_TOPLEVEL_DIRECTORY ON)
  include(CPack)
  return()
endif()

set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_MAINTAINER "${LB_MAINTAINER}")
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# Our own libraries are found in the build; their packages are named in the Depends below.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_BINARY_DIR}/bin)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(_lb_v ${PROJECT_VERSION})

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME lbvisa-runtime)
set(CPACK_COMPONENT_RUNTIME_DESCRIPTION "VISA runtime with the VISA C API (libvisa)
A small VISA runtime: the VISA C API library libvisa and the service library
libNiViSv64 that hosts passports. It loads the passports named by the files in
/etc/lbvisa/passports.d, or by LBVISA_PASSPORTS in the environment.")

set(CPACK_DEBIAN_PASSPORT_PACKAGE_NAME lbpmx-passport)
set(CPACK_DEBIAN_PASSPORT_PACKAGE_SECTION misc)
set(CPACK_DEBIAN_PASSPORT_PACKAGE_DEPENDS "lbvisa-runtime (>= ${_lb_v}), pmxcontrol2")
set(CPACK_COMPONENT_PASSPORT_DESCRIPTION "VISA passport for USB power sensors
The passport module LbViPmx64 lets VISA applications (C programs, pyvisa)
reach USB power sensors as message-based SCPI instruments. It registers
itself with the VISA runtime in /etc/lbvisa/passports.d. Includes the
example program lbpmx-measure, which lists the sensors and measures.")

set(CPACK_DEBIAN_SENSORSIM_PACKAGE_NAME pmxcontrol2-sim)
set(CPACK_DEBIAN_SENSORSIM_PACKAGE_PROVIDES pmxcontrol2)
set(CPACK_DEBIAN_SENSORSIM_PACKAGE_CONFLICTS pmxcontrol2)
set(CPACK_DEBIAN_SENSORSIM_PACKAGE_REPLACES pmxcontrol2)
set(CPACK_COMPONENT_SENSORSIM_DESCRIPTION "Simulated USB power sensor control library
libPmxControl2_64 with simulated sensors (by default two, PMX-M01 100000
and PMX-M10 100001; PMXSIM_DEVICES chooses others), for running the
passport without hardware. It provides pmxcontrol2, the sensor-control
library the passport needs, so the vendor's library replaces it.")

set(CPACK_DEBIAN_PYTHON_PACKAGE_NAME python3-pmxsim)
set(CPACK_DEBIAN_PYTHON_PACKAGE_SECTION python)
set(CPACK_DEBIAN_PYTHON_PACKAGE_ARCHITECTURE all)
set(CPACK_DEBIAN_PYTHON_PACKAGE_DEPENDS "python3:any, pmxcontrol2-sim (= ${_lb_v})")
set(CPACK_COMPONENT_PYTHON_DESCRIPTION "Python module pmxsim for the simulated power sensors
Scripts the simulated sensor-control library that the process's VISA
runtime loaded: attaches and detaches sensors, queues results, injects
errors and faults, loads scenario files. Includes a pytest fixture.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME lbvisa-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS "lbvisa-runtime (= ${_lb_v}), pmxcontrol2")
set(CPACK_COMPONENT_DEV_DESCRIPTION "VISA C API development files
Headers (visa.h, visatype.h, pmxsim/PmxControl2.h, pmxsim/PmxSim.h),
pkg-config files (visa, pmxcontrol2), the CMake package LbPmxVisa with
imported targets, and the source of the example program.")

# Each package's copyright and changelog; the shared libraries' packages trigger ldconfig
# (their maintainer scripts, which CPack writes, run it as well); the configuration file of
# the passport is a conffile.
string(TIMESTAMP LB_CHANGELOG_DATE "%a, %d %b %Y %H:%M:%S +0000" UTC)
string(TIMESTAMP LB_COPYRIGHT_YEAR "%Y" UTC)
configure_file(packaging/debian/copyright.in ${CMAKE_BINARY_DIR}/packaging/copyright @ONLY)
foreach(_lb_comp runtime passport sensorsim python dev)
  string(TOUPPER ${_lb_comp} _lb_upper)
  set(LB_DEB_PACKAGE ${CPACK_DEBIAN_${_lb_upper}_PACKAGE_NAME})
  set(_lb_doc ${CMAKE_BINARY_DIR}/packaging/doc/${LB_DEB_PACKAGE})
  configure_file(packaging/debian/changelog.in ${_lb_doc}/changelog @ONLY)
  execute_process(COMMAND gzip -9nc ${_lb_doc}/changelog OUTPUT_FILE ${_lb_doc}/changelog.gz)
  install(FILES ${CMAKE_BINARY_DIR}/packaging/copyright ${_lb_doc}/changelog.gz
    DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/${LB_DEB_PACKAGE} COMPONENT ${_lb_comp})
endforeach()
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${CMAKE_SOURCE_DIR}/packaging/debian/triggers)
set(CPACK_DEBIAN_SENSORSIM_PACKAGE_CONTROL_EXTRA ${CMAKE_SOURCE_DIR}/packaging/debian/triggers)
set(_lb_conffile ${LB_PASSPORT_CONF_DIR}/LbViPmx64.conf)
if(NOT IS_ABSOLUTE ${_lb_conffile})
  set(_lb_conffile /usr/${_lb_conffile})  # where a package puts a relative install path
endif()
file(WRITE ${CMAKE_BINARY_DIR}/packaging/conffiles "${_lb_conffile}\n")
set(CPACK_DEBIAN_PASSPORT_PACKAGE_CONTROL_EXTRA ${CMAKE_BINARY_DIR}/packaging/conffiles)
include(CPack)
