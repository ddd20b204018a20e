# Finds the Android platform libraries Debian packages for the host:
# liblog (android-liblog-dev) and libutils (android-libutils-dev).
set(_android_libdir /usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/android)

find_path(ANDROID_INCLUDE_DIR android/log.h PATHS /usr/include/android NO_DEFAULT_PATH)
find_library(ANDROID_LOG_LIBRARY log PATHS ${_android_libdir} NO_DEFAULT_PATH)
find_path(ANDROID_UTILS_INCLUDE_DIR utils/StrongPointer.h PATHS /usr/include/android NO_DEFAULT_PATH)
find_library(ANDROID_UTILS_LIBRARY utils PATHS ${_android_libdir} NO_DEFAULT_PATH)

if(NOT ANDROID_INCLUDE_DIR OR NOT ANDROID_LOG_LIBRARY)
  message(FATAL_ERROR "Android liblog not found (looked for /usr/include/android/android/log.h "
                      "and ${_android_libdir}/liblog.so): apt-get install android-liblog-dev")
endif()
if(NOT ANDROID_UTILS_INCLUDE_DIR OR NOT ANDROID_UTILS_LIBRARY)
  message(FATAL_ERROR "Android libutils not found (looked for /usr/include/android/utils/StrongPointer.h "
                      "and ${_android_libdir}/libutils.so): apt-get install android-libutils-dev")
endif()

add_library(android::log SHARED IMPORTED)
set_target_properties(android::log PROPERTIES
  IMPORTED_LOCATION ${ANDROID_LOG_LIBRARY}
  INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_INCLUDE_DIR})

add_library(android::utils SHARED IMPORTED)
set_target_properties(android::utils PROPERTIES
  IMPORTED_LOCATION ${ANDROID_UTILS_LIBRARY}
  INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_UTILS_INCLUDE_DIR})

# The packaged libraries live outside the loader's default path.
set(ANDROID_PLATFORM_RPATH ${_android_libdir})
