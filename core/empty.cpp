// Keeps an engine library non-empty while its sources are being written.
namespace core_empty { int Unused = 0; }
