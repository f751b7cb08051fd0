"""Changes sources in small ways and checks whether the tests fail. See scripts/mutate."""
