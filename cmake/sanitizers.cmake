# KIV_SANITIZE=address,undefined or =thread builds everything with those sanitizers.
set(KIV_SANITIZE "" CACHE STRING "Sanitizers to build with, as -fsanitize= takes them")
if(KIV_SANITIZE)
    add_compile_options(-fsanitize=${KIV_SANITIZE} -fno-omit-frame-pointer
        -fno-sanitize-recover=all)
    # The sanitizers' own dlopen does not see the newer kind of run path.
    add_link_options(-fsanitize=${KIV_SANITIZE} -Wl,--disable-new-dtags)
endif()
