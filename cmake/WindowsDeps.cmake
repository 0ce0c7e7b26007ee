# The third-party code of the Windows build, made by scripts/windows-deps
# with mingw-w64 under <build>/deps on the first configure, as the imported
# targets the Linux build gets from its find_package calls.
set(ALERTMOD_WINDOWS_DEPS ${CMAKE_BINARY_DIR}/deps)
execute_process(COMMAND ${PROJECT_SOURCE_DIR}/scripts/windows-deps ${ALERTMOD_WINDOWS_DEPS}
                RESULT_VARIABLE deps_result)
if(NOT deps_result EQUAL 0)
  message(FATAL_ERROR "scripts/windows-deps failed")
endif()
set(deps_include ${ALERTMOD_WINDOWS_DEPS}/include)
set(deps_lib ${ALERTMOD_WINDOWS_DEPS}/lib)

# The module loads FFmpeg by file name at run time; only its headers are used.
set(FFMPEG_HEADERS_INCLUDE_DIRS ${deps_include})

add_library(Boost::headers INTERFACE IMPORTED)
set_target_properties(Boost::headers PROPERTIES
  INTERFACE_INCLUDE_DIRECTORIES ${deps_include}
  INTERFACE_COMPILE_DEFINITIONS "_WIN32_WINNT=0x0601"
  INTERFACE_LINK_LIBRARIES "ws2_32;mswsock")

add_library(tinyxml::tinyxml STATIC IMPORTED)
set_target_properties(tinyxml::tinyxml PROPERTIES
  IMPORTED_LOCATION ${deps_lib}/libtinyxml.a
  INTERFACE_INCLUDE_DIRECTORIES ${deps_include}
  INTERFACE_COMPILE_DEFINITIONS TIXML_USE_STL)

foreach(lib gtest gmock gtest_main)
  add_library(GTest::${lib} STATIC IMPORTED)
  set_target_properties(GTest::${lib} PROPERTIES
    IMPORTED_LOCATION ${deps_lib}/lib${lib}.a
    INTERFACE_INCLUDE_DIRECTORIES ${deps_include})
endforeach()
set_target_properties(GTest::gmock PROPERTIES INTERFACE_LINK_LIBRARIES GTest::gtest)
set_target_properties(GTest::gtest_main PROPERTIES INTERFACE_LINK_LIBRARIES GTest::gtest)

# Unit tests that cannot run as Windows programs, by source file:
# alertmod_unit_tests leaves them out of this build.
set(ALERTMOD_WINDOWS_SKIPPED_TESTS
  # Encrypts through the reference host's password service, which is built
  # on OpenSSL; Debian has no mingw build of OpenSSL.
  credentials_test.cpp
  # Simulates crashes with fork and limits file sizes with setrlimit.
  durable_xml_test.cpp
  # Sets TMPDIR with setenv, which the Windows C runtime does not have.
  stream_info_test.cpp
  # Opens the stand-in codec libraries with dlopen.
  av_libs_test.cpp)

# Test cases (gtest patterns) that cannot pass under Wine.
set(ALERTMOD_WINDOWS_SKIPPED_CASES
  # Counts the open descriptors in Linux's /proc/self/fd, which under Wine
  # are Wine's own.
  FilesTest.AMovedFileIsClosedOnceByItsLastOwner
  # Need the ffmpeg and ffprobe programs and FFmpeg's DLLs for Windows, which
  # Debian does not ship.
  StreamMuxerTest.* ClipWriterTest.*
  # Pin Linux's error numbers and texts ("111: ... Connection refused"); on
  # Windows the log carries Winsock's (10061), and Wine has no text for them.
  WebLinkTest.UnreachableServerIsLoggedWithItsError WebLinkTest.SilentServerEndsAtTheTimeout
  HttpGetClientTest.SilentServerTimesOut
  # Expect the Date line's zone name "(CET)"; Wine's C runtime shortens the
  # name of TZ=CET-1CEST to "CE" (some also parse the message with Python,
  # which a Windows program cannot pipe from under Wine).
  MailFileTest.PlainMessage MailFileTest.OneJpeg MailFileTest.FailedAttachmentIsDescribedInTheBody
  MailFileTest.SplitsBySizeLimit MailFileTest.AddressLines
  MailFileTest.LineBreaksCannotForgeHeaders MailFileTest.CompositionFailures
  # Makes the message file a symbolic link to /dev/full, which Wine cannot.
  MailFileTest.FullVolumeFailsTheMessage)

# The parts of the reference host that the unit tests use and that build for
# Windows: the system descriptions (the password service needs OpenSSL).
add_library(alertmod_host_system STATIC ${PROJECT_SOURCE_DIR}/host/system_description.cpp)
target_include_directories(alertmod_host_system PUBLIC ${PROJECT_SOURCE_DIR})
target_link_libraries(alertmod_host_system PUBLIC tinyxml::tinyxml)

# mingw's own printf family, which knows C99's conversions (%zu, %lld); the
# system's msvcrt.dll does not.
add_compile_definitions(__USE_MINGW_ANSI_STDIO=1)
# GCC checks printf-style formats against msvcrt.dll's conversions here, not
# against mingw's printf that the line above selects; the Linux builds check
# the formats.
add_compile_options(-Wno-format)
