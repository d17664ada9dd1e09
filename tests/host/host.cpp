// A host program that sees the library only through its installed umbrella header: it must
// compile and link against an installed tree, and create and reopen a database.
#include <vxcore3/vxcore3.h>

#include <cstdio>
#include <string>

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  SVXCreateInfo info;
  info.Name = std::string(argv[1]) + "/host.vxm";
  CVXEngine engine;
  unsigned rc = engine.Create(info);
  if (rc == VX_OK) rc = engine.Close();
  if (rc == VX_OK) rc = engine.Open(info);
  std::printf("%u\n", rc);
  return rc == VX_OK ? 0 : 1;
}
