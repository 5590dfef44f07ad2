# The platform libraries as Debian packages them: headers under /usr/include/android and
# libraries under <libdir>/android, neither of which is on the default search path.
set(ANDROID_PLATFORM_INCLUDE_DIR /usr/include/android CACHE PATH "Platform headers")
set(ANDROID_PLATFORM_LIBRARY_DIR /usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/android
    CACHE PATH "Platform libraries")

if(NOT EXISTS ${ANDROID_PLATFORM_INCLUDE_DIR}/utils/RefBase.h)
    message(FATAL_ERROR "Platform headers not found in ${ANDROID_PLATFORM_INCLUDE_DIR}; "
                        "run scripts/install-deps")
endif()

foreach(lib utils cutils log base)
    find_library(ANDROID_${lib}_LIBRARY NAMES ${lib}
                 PATHS ${ANDROID_PLATFORM_LIBRARY_DIR} NO_DEFAULT_PATH REQUIRED)
    add_library(android::${lib} SHARED IMPORTED)
    set_target_properties(android::${lib} PROPERTIES
        IMPORTED_LOCATION ${ANDROID_${lib}_LIBRARY}
        INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_PLATFORM_INCLUDE_DIR})
endforeach()
