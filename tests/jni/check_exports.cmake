# Checks the dynamic symbol table of libhalvenor.so: exactly the library's
# external names, unmangled, and none of its private ones.
# Usage: cmake -DLIBRARY=<path> -P check_exports.cmake
cmake_policy(SET CMP0057 NEW)
set(expected
  JNI_OnLoad
  classInitNative initNative enterTestModeNative quitTestModeNative
  sendTestCommandNative destoryNative sendCwtxCommandNative
  registerNatives registerNativeMethods
  onSendCmdSuccess onReceivedTestData sendBleTestCommand
  hidl_client_initialize hidl_client_init hidl_client_close process_tool_data
  hci_send_cmd hci_send_cmd_rawcmd read_incoming_events
  hci_enable_device_under_test_mode hci_disable_device_under_test_mode
  gMethods server_fd client_fd btHci timeout)
# Symbols the linker defines in every shared object.
set(linker_defined _init _fini _edata _end __bss_start)

execute_process(COMMAND nm -D --defined-only ${LIBRARY}
                OUTPUT_VARIABLE table RESULT_VARIABLE rc)
if(NOT rc EQUAL 0)
  message(FATAL_ERROR "nm failed on ${LIBRARY}")
endif()

string(REPLACE "\n" ";" lines "${table}")
set(found)
set(unexpected)
foreach(line ${lines})
  if(NOT line MATCHES "^[0-9a-fA-F]* *([A-Za-z]) (.+)$")
    continue()
  endif()
  set(name ${CMAKE_MATCH_2})
  if(name IN_LIST linker_defined)
    continue()
  endif()
  # AddressSanitizer's one-definition-rule indicators of exported data.
  if(name MATCHES "^__odr_asan[._]")
    continue()
  endif()
  list(APPEND found ${name})
  if(NOT name IN_LIST expected)
    list(APPEND unexpected ${name})
  endif()
endforeach()

set(missing)
foreach(name ${expected})
  if(NOT name IN_LIST found)
    list(APPEND missing ${name})
  endif()
endforeach()

if(missing OR unexpected)
  message(FATAL_ERROR "exports of ${LIBRARY}:\n  missing: ${missing}\n  unexpected: ${unexpected}")
endif()
list(LENGTH expected count)
message(STATUS "${count} exported names, as expected")
