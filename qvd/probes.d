/* The qvd provider: the daemon's traffic, observable without logging. */
provider qvd {
  probe client__new(int pid);
  probe client__done(int pid);
  probe request__input(int pid, char *description);
  probe request(int pid, char *name);
  probe request__output(int pid, char *description);
  probe db__load(char *domain, uint64_t code);
  probe discover__raw(unsigned int count);
  probe plugin__add(char *path);
  probe plugin__ready(char *uuid);
  probe plugin__remove(char *path, bool resolved);
};
