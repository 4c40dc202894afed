#include "daemon/daemon.h"

int main(int argc, char **argv) {
  return daemon_run(argc, argv);
}
