# A build for another architecture of Debian, with its own cross compiler and libraries (scripts/cross):
#   REMVOL_TRIPLET=aarch64-linux-gnu cmake --preset release -B build/arm64 --toolchain cmake/cross.cmake
set(REMVOL_TRIPLET "$ENV{REMVOL_TRIPLET}" CACHE STRING "Debian's name of the architecture that is built for")
set(CMAKE_TRY_COMPILE_PLATFORM_VARIABLES REMVOL_TRIPLET)
set(CMAKE_SYSTEM_NAME Linux)
string(REGEX MATCH "^[^-]+" CMAKE_SYSTEM_PROCESSOR "${REMVOL_TRIPLET}")

set(CMAKE_C_COMPILER ${REMVOL_TRIPLET}-gcc)
set(CMAKE_CXX_COMPILER ${REMVOL_TRIPLET}-g++)
set(CMAKE_LIBRARY_ARCHITECTURE ${REMVOL_TRIPLET})
set(PKG_CONFIG_EXECUTABLE /usr/bin/${REMVOL_TRIPLET}-pkg-config)
