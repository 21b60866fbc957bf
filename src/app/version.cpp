namespace vaultora {
const char* programVersion() { return "0.1"; }
}  // namespace vaultora
