// Module entry. The static initialisers (the twelve data types and the two
// option definitions) run when the module is loaded and their destructors
// when it is unloaded, through the loader's init and fini arrays. This
// platform sends no per-thread attach or detach calls to a shared object, so
// the entry has nothing to switch off: it runs at load and succeeds.
namespace {

__attribute__((constructor)) void ModuleAttach() {}

}  // namespace
