# What makes a fault harder to use, in whatever is built.
add_compile_options(-fstack-protector-strong)
add_link_options(-Wl,-z,relro,-z,now)
# The address sanitizer sees more without the library's checks in place of its own.
if(NOT KIV_SANITIZE AND NOT CMAKE_BUILD_TYPE STREQUAL Debug)
    add_compile_options(-U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2)
endif()
