/* The daemon's trace probes (provider "axd"). A double underscore in a probe's name is a hyphen
   to tracers: client__new is listed as client-new. */
provider axd {
  probe client__new(int pid);
  probe client__done(int pid);
  probe request__input(int pid, char* description);
  probe request(int pid, char* type);
  probe request__output(int pid, char* description);
  probe discover__raw(unsigned int count);
  probe plugin__add(char* path);
  probe plugin__remove(char* path, bool resolved);
  probe plugin__ready(char* uuid);
  probe db__load(char* domain, uint64_t code);
};
