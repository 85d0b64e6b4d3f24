# The recording service keeps its catalog in SQLite and writes the recordings'
# programme tables with libdvbpsi.
pkg_check_modules(SQLITE3 REQUIRED IMPORTED_TARGET sqlite3)
target_link_libraries(${target} PUBLIC PkgConfig::SQLITE3 PkgConfig::DVBPSI)
