#include "daemon/startup.h"

int main(int argc, char** argv) { return kivd::run_daemon(argc, argv); }
