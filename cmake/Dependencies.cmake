# Third-party libraries of the modem. KISS FFT is compiled from the copy in
# third_party/kissfft on every target, so libSorvel.so is linked the same
# way everywhere (its objects go into sorvel_core; the JNI library hides
# them). Eigen comes from Debian's package on the host and in the browser
# build; Android has no such packages, so a pinned release is fetched there.
# The Android branch cannot be exercised on the development machines (no
# NDK, no network beyond Debian); add a URL_HASH when it is first built for
# real.

add_library(sorvel_kissfft OBJECT ${PROJECT_SOURCE_DIR}/third_party/kissfft/kiss_fft.c
                                  ${PROJECT_SOURCE_DIR}/third_party/kissfft/kiss_fftr.c)
target_include_directories(sorvel_kissfft SYSTEM PUBLIC
                           $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/third_party/kissfft>)
target_compile_definitions(sorvel_kissfft PUBLIC kiss_fft_scalar=float)
# KISS FFT's own flags (as Debian builds it): results bit-identical to the
# library the modem was developed against. -ffast-math here changes only
# this code's arithmetic; it is not passed to any link.
target_compile_options(sorvel_kissfft PRIVATE -w ${SORVEL_DSP_OPTIONS} -ffast-math
                       -fomit-frame-pointer)

if(ANDROID)
  include(FetchContent)
  # Eigen is header-only: unpack it and point an interface target at it.
  FetchContent_Declare(eigen
    URL https://gitlab.com/libeigen/eigen/-/archive/3.4.0/eigen-3.4.0.tar.gz)
  FetchContent_GetProperties(eigen)
  if(NOT eigen_POPULATED)
    FetchContent_Populate(eigen)
  endif()
  add_library(sorvel_eigen INTERFACE)
  target_include_directories(sorvel_eigen SYSTEM INTERFACE ${eigen_SOURCE_DIR})
  add_library(Eigen3::Eigen ALIAS sorvel_eigen)
  find_library(SORVEL_ANDROID_LOG_LIBRARY log REQUIRED)
elseif(EMSCRIPTEN)
  # The browser build: Eigen from Debian's headers.
  add_library(sorvel_eigen INTERFACE)
  target_include_directories(sorvel_eigen SYSTEM INTERFACE /usr/include/eigen3)
  add_library(Eigen3::Eigen ALIAS sorvel_eigen)
else()
  find_package(Eigen3 3.4 CONFIG REQUIRED)

  # The Android log library built for the host (android-liblog-dev), to
  # compile and test the Android log sink here.
  find_path(SORVEL_HOST_LIBLOG_INCLUDE_DIR android/log.h PATH_SUFFIXES android)
  find_library(SORVEL_HOST_LIBLOG_LIBRARY log PATH_SUFFIXES android)
  if(SORVEL_HOST_LIBLOG_INCLUDE_DIR AND SORVEL_HOST_LIBLOG_LIBRARY)
    set(SORVEL_HOST_ANDROID_LOG_DEFAULT ON)
  else()
    set(SORVEL_HOST_ANDROID_LOG_DEFAULT OFF)
  endif()
  option(SORVEL_HOST_ANDROID_LOG
         "Build and test the Android log sink against the host liblog"
         ${SORVEL_HOST_ANDROID_LOG_DEFAULT})

  # JNI headers for the peers and Java for the peer classes and their tests.
  # CMake 3.25 does not find OpenJDK 17 by itself: derive JAVA_HOME from
  # javac (JAVA_HOME/bin/javac) when it is not set.
  if(NOT DEFINED ENV{JAVA_HOME} AND NOT JAVA_HOME)
    find_program(SORVEL_JAVAC javac)
    if(SORVEL_JAVAC)
      file(REAL_PATH "${SORVEL_JAVAC}" _sorvel_javac_real)
      get_filename_component(_sorvel_java_bin "${_sorvel_javac_real}" DIRECTORY)
      get_filename_component(JAVA_HOME "${_sorvel_java_bin}" DIRECTORY)
      set(JAVA_HOME "${JAVA_HOME}" CACHE PATH "JDK used for JNI and Java")
    endif()
  endif()
  if(CMAKE_CROSSCOMPILING)
    # jni.h and jni_md.h are the same for every Linux target; take the host
    # JDK's rather than looking for a target JVM.
    set(JNI_INCLUDE_DIRS "${JAVA_HOME}/include" "${JAVA_HOME}/include/linux")
  else()
    find_package(JNI REQUIRED)
  endif()
endif()
