# Fails unless the Windows passport exports nothing under the name LbViPmx64.dll and imports the
# sensor library PmxControl2_64.dll by name (with every function a name).
# Usage: cmake -DOBJDUMP=<objdump> -DMODULE=<dll> -P CheckPassportModule.cmake
execute_process(COMMAND ${OBJDUMP} -p ${MODULE} OUTPUT_VARIABLE _dump RESULT_VARIABLE _rc)
if(NOT _rc EQUAL 0)
  message(FATAL_ERROR "objdump failed on ${MODULE}")
endif()
if(NOT _dump MATCHES "Name[ \t]+[0-9a-fA-F]+ LbViPmx64\\.dll")
  message(FATAL_ERROR "${MODULE}: the export directory does not name LbViPmx64.dll")
endif()
if(NOT _dump MATCHES "Export Address Table[ \t]+00000000")
  message(FATAL_ERROR "${MODULE} exports something")
endif()
string(REGEX MATCH "DLL Name: PmxControl2_64\\.dll[^\n]*\n[^\n]*\n([^\n]+\n)+" _block "${_dump}")
if(NOT _block MATCHES "PmxOpenDriver" OR NOT _block MATCHES "PmxSetNotifyCallbackStateChanged")
  message(FATAL_ERROR "${MODULE} does not import the sensor library by name:\n${_block}")
endif()
message(STATUS "${MODULE}: exports nothing, imports PmxControl2_64.dll by name")
