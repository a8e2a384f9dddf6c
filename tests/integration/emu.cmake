# emu tests
