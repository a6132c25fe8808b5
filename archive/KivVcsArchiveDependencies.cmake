include(CMakeFindDependencyMacro)
find_dependency(SQLite3)
find_dependency(Threads)
