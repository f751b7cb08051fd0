"""Changes sources in small ways and looks whether the tests notice. See scripts/mutate."""
