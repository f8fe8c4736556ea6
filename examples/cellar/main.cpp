#include "examples/cellar/CellarProvider.h"

int main() {
  docuvend::cellar::CellarProvider provider;
  return docuvend::runProvider(provider);
}
