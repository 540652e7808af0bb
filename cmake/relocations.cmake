# Packed relocations take a tenth of the room, where the loader knows them: glibc 2.36.
include(CheckCXXSourceCompiles)
set(CMAKE_REQUIRED_LINK_OPTIONS -Wl,-z,pack-relative-relocs)
check_cxx_source_compiles("
    #include <cstdlib>
    static_assert(__GLIBC_PREREQ(2, 36));
    int main() { return 0; }" KIV_PACKS_RELOCATIONS)
unset(CMAKE_REQUIRED_LINK_OPTIONS)
