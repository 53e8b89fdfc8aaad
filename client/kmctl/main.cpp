#include "client/kmctl/application.h"

int main(int argc, char** argv) {
  return kmctl::run(argc, argv);
}
