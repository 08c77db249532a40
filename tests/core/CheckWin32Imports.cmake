# cmake -DOBJDUMP=<objdump> -DEXE=<file.exe> -P CheckWin32Imports.cmake
# The Windows core primitives must be the Win32 kernel objects themselves, and the
# statically linked executable must need no runtime DLL beyond the system's own.
execute_process(COMMAND ${OBJDUMP} -p ${EXE} OUTPUT_VARIABLE dump RESULT_VARIABLE failed)
if(failed)
  message(FATAL_ERROR "${OBJDUMP} -p ${EXE} failed")
endif()
foreach(import CreateSemaphore ReleaseSemaphore WaitForSingleObject EnterCriticalSection LeaveCriticalSection)
  if(NOT dump MATCHES "[ \t]${import}[AW]?\n")
    message(FATAL_ERROR "${EXE} does not import ${import}")
  endif()
endforeach()
string(REGEX MATCHALL "DLL Name: [^\n]+" dlls "${dump}")
foreach(dll ${dlls})
  if(NOT dll MATCHES "DLL Name: (KERNEL32|msvcrt|USER32|ADVAPI32|ucrtbase|api-ms-win-[^ ]+)\\.dll$")
    message(FATAL_ERROR "${EXE} needs a runtime DLL that Windows does not ship: ${dll}")
  endif()
endforeach()
message(STATUS "${EXE}: Win32 semaphore and critical-section imports present; ${dlls}")
