"""Support classes shared by the editor's components."""
