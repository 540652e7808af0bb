// Somebody else's producer in C++: sends an event to the daemon whose directory it is given.
#include <kiv.h>

#include <memory>
#include <string>

int main(int argc, char** argv) {
    if (argc != 2) return 1;
    const std::unique_ptr<kiv_handle, decltype(&kiv_destroy)> kiv(kiv_create_from_path(argv[1]),
                                                                  kiv_destroy);
    const std::string payload = "c++";
    if (!kiv) return 1;
    return kiv_add_event(kiv.get(), "outside", NAME, payload.data(), payload.size()) == 0 ? 0 : 1;
}
