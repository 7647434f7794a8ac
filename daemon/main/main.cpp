#include <string>
#include <vector>

#include "daemon/Ferrule.h"

int main(int count, char** values) {
  return kx::runFerrule(std::vector<std::string>(values + 1, values + count));
}
