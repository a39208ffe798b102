# Part of the installation: has the installed units in `unit_dir` name the programs and helpers below the prefix.
cmake_path(ABSOLUTE_PATH unit_dir BASE_DIRECTORY "${CMAKE_INSTALL_PREFIX}")
file(GLOB units "$ENV{DESTDIR}${unit_dir}/remvol*.service")
foreach(unit IN LISTS units)
  file(READ "${unit}" text)
  string(REGEX REPLACE "/usr/(bin|lib/remvol)/" "${CMAKE_INSTALL_PREFIX}/\\1/" text "${text}")
  file(WRITE "${unit}" "${text}")
endforeach()
