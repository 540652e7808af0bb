/* Somebody else's producer in C: sends an event to the daemon whose directory it is given. */
#include <kiv.h>

int main(int argc, char** argv) {
    kiv_handle* kiv = argc == 2 ? kiv_create_from_path(argv[1]) : NULL;
    int result;
    if (kiv == NULL) return 1;
    result = kiv_add_event(kiv, "outside", "from_c", "c", 1);
    kiv_destroy(kiv);
    return result == 0 ? 0 : 1;
}
